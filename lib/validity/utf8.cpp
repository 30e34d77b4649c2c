// Decoding of UTF-8, strict: no overlong forms, no surrogates, nothing above U+10FFFF.
#include "validity/utf8.h"

#include <algorithm>
#include <array>
#include <optional>

namespace {

struct Character {
    char32_t code;
    size_t length; // in bytes
};

// How many bytes a character takes that begins with this one; 0 when none does.
size_t lengthOf(unsigned char first) {
    if (first < 0x80) {
        return 1;
    }
    if (first < 0xC0 || first >= 0xF8) {
        return 0;
    }
    return first < 0xE0 ? 2 : first < 0xF0 ? 3 : 4;
}

// The first character of a text that is not empty, or nothing.
std::optional<Character> firstOf(std::string_view text) {
    constexpr std::array<char32_t, 5> kSmallest = {0, 0, 0x80, 0x800, 0x10000};
    const auto first = static_cast<unsigned char>(text.front());
    const size_t length = lengthOf(first);
    if (length == 0 || length > text.size()) {
        return std::nullopt;
    }
    char32_t code = length == 1 ? first : first & (0x7FU >> length);
    for (const char byte : text.substr(1, length - 1)) {
        if ((static_cast<unsigned char>(byte) & 0xC0) != 0x80) {
            return std::nullopt;
        }
        code = code << 6 | (static_cast<unsigned char>(byte) & 0x3F);
    }
    const bool isSurrogate = code >= 0xD800 && code <= 0xDFFF;
    return code < kSmallest[length] || code > 0x10FFFF || isSurrogate
               ? std::nullopt
               : std::optional(Character{code, length});
}

// Controls, line and paragraph ends, marks that change the direction of writing, and what takes no
// room.
bool isTreacherous(char32_t code) {
    constexpr std::array<std::array<char32_t, 2>, 10> kRanges = {{{0x00, 0x1F},
                                                                  {0x7F, 0x9F},
                                                                  {0xAD, 0xAD},
                                                                  {0x061C, 0x061C},
                                                                  {0x180E, 0x180E},
                                                                  {0x200B, 0x200F},
                                                                  {0x2028, 0x202E},
                                                                  {0x2060, 0x206F},
                                                                  {0xFEFF, 0xFEFF},
                                                                  {0xE0000, 0xE007F}}};
    return std::any_of(kRanges.begin(), kRanges.end(),
                       [code](const auto &range) { return code >= range[0] && code <= range[1]; });
}

} // namespace

bool sched::isUtf8(std::string_view text) {
    while (!text.empty()) {
        const auto character = firstOf(text);
        if (!character) {
            return false;
        }
        text.remove_prefix(character->length);
    }
    return true;
}

std::string sched::toUtf8(std::string_view text) {
    std::string result;
    while (!text.empty()) {
        const auto character = firstOf(text);
        const size_t length = character ? character->length : 1;
        result += character ? text.substr(0, length) : "\uFFFD";
        text.remove_prefix(length);
    }
    return result;
}

std::string sched::quoted(std::string_view text) {
    constexpr size_t kMostCharacters = 60;
    std::string result = "\"";
    for (size_t count = 0; !text.empty(); ++count) {
        if (count == kMostCharacters) {
            result += "…";
            break;
        }
        const auto character = firstOf(text);
        const size_t length = character ? character->length : 1;
        const bool isShown = character && !isTreacherous(character->code);
        result += isShown ? text.substr(0, length) : "\uFFFD";
        text.remove_prefix(length);
    }
    return result + "\"";
}
