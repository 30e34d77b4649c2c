// UTF-8 on a terminal, with libunistring's tables.
#include "text/utf8.h"

#include <array>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <unicase.h>
#include <unictype.h>
#include <unigbrk.h>
#include <unistr.h>
#include <uniwidth.h>

namespace tavisched {

namespace {

constexpr const char *kEncoding = "UTF-8";
constexpr uint32_t kControls = UC_CATEGORY_MASK_Cc | UC_CATEGORY_MASK_Zl | UC_CATEGORY_MASK_Zp;

const uint8_t *bytesOf(std::string_view text) {
    return reinterpret_cast<const uint8_t *>(text.data());
}

bool isControl(ucs4_t character) {
    return uc_is_general_category_withtable(character, kControls);
}

// What could move a terminal's cursor, make a text look like another one, or cannot be seen at all.
// The marks that choose how a character looks (U+FE00 to U+FE0F) are part of it.
bool isTreacherous(ucs4_t character) {
    const bool isVariation = character >= 0xFE00 && character <= 0xFE0F;
    return uc_is_general_category_withtable(character, kControls | UC_CATEGORY_MASK_Cf) ||
           (uc_is_property_default_ignorable_code_point(character) && !isVariation);
}

// "\u001b"; as in JSON a character above U+FFFF takes two.
std::string escape(ucs4_t character) {
    std::array<char, 16> text{};
    if (character > 0xFFFF) {
        std::snprintf(text.data(), text.size(), "\\u%04x\\u%04x",
                      static_cast<unsigned int>(0xD800 + ((character - 0x10000) >> 10)),
                      static_cast<unsigned int>(0xDC00 + (character & 0x3FF)));
    } else {
        std::snprintf(text.data(), text.size(), "\\u%04x", static_cast<unsigned int>(character));
    }
    return text.data();
}

// Hands every character of the text to the function; bytes that are none come as U+FFFD.
template <typename Function> void forEachCharacter(std::string_view text, Function &&function) {
    while (!text.empty()) {
        ucs4_t character = 0;
        const int length = u8_mbtouc(&character, bytesOf(text), text.size());
        function(character);
        text.remove_prefix(static_cast<size_t>(length));
    }
}

} // namespace

bool isUtf8(std::string_view text) {
    return u8_check(bytesOf(text), text.size()) == nullptr;
}

bool holdsControls(std::string_view text) {
    bool found = false;
    forEachCharacter(text, [&](ucs4_t character) { found = found || isControl(character); });
    return found;
}

namespace {

std::string escaped(std::string_view text, bool keepsLines) {
    std::string result;
    forEachCharacter(text, [&](ucs4_t character) {
        if (character == '\t') {
            result += ' ';
        } else if (isTreacherous(character) && !(keepsLines && character == '\n')) {
            result += escape(character);
        } else {
            uint8_t bytes[6];
            const int length = u8_uctomb(bytes, character, sizeof bytes);
            result.append(reinterpret_cast<const char *>(bytes), static_cast<size_t>(length));
        }
    });
    return result;
}

} // namespace

bool isBlank(std::string_view text) {
    bool blank = true;
    forEachCharacter(text, [&](ucs4_t character) {
        blank = blank && (uc_is_property_white_space(character) || isTreacherous(character));
    });
    return blank;
}

std::string printable(std::string_view text) {
    return escaped(text, false);
}

std::string printableLines(std::string_view text) {
    return escaped(text, true);
}

std::string folded(std::string_view text) {
    size_t length = 0;
    const std::unique_ptr<uint8_t, decltype(&std::free)> result(
        u8_casefold(bytesOf(text), text.size(), nullptr, nullptr, nullptr, &length), std::free);
    return result ? std::string(reinterpret_cast<const char *>(result.get()), length)
                  : std::string(text);
}

size_t widthOf(std::string_view text) {
    return static_cast<size_t>(u8_width(bytesOf(text), text.size(), kEncoding));
}

std::string cutTo(std::string_view text, size_t width) {
    if (widthOf(text) <= width) {
        return std::string(text);
    }
    constexpr std::string_view kEllipsis = "…";
    const uint8_t *const begin = bytesOf(text);
    const uint8_t *const end = begin + text.size();
    const uint8_t *cut = begin;
    for (const uint8_t *next = cut; next && next != end; next = u8_grapheme_next(next, end)) {
        const auto length = static_cast<size_t>(next - begin);
        if (widthOf(text.substr(0, length)) + 1 > width) {
            break;
        }
        cut = next;
    }
    return std::string(text.substr(0, static_cast<size_t>(cut - begin))) + std::string(kEllipsis);
}

std::vector<std::string> split(std::string_view text, char separator) {
    std::vector<std::string> parts;
    for (size_t begin = 0; begin <= text.size();) {
        const size_t end = std::min(text.find(separator, begin), text.size());
        parts.emplace_back(text.substr(begin, end - begin));
        begin = end + 1;
    }
    return parts;
}

std::string join(const std::vector<std::string> &parts, std::string_view separator) {
    std::string result;
    for (const std::string &part : parts) {
        result.append(result.empty() ? "" : separator).append(part);
    }
    return result;
}

} // namespace tavisched
