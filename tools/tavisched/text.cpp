// UTF-8 on a terminal, with libunistring's tables.
#include "text.h"

#include <cstdint>
#include <unictype.h>
#include <unigbrk.h>
#include <unistr.h>
#include <uniwidth.h>

namespace tavisched {

namespace {

constexpr const char *kEncoding = "UTF-8";
constexpr ucs4_t kReplacement = 0xFFFD;
constexpr uint32_t kControls = UC_CATEGORY_MASK_Cc | UC_CATEGORY_MASK_Zl | UC_CATEGORY_MASK_Zp;

const uint8_t *bytesOf(std::string_view text) {
    return reinterpret_cast<const uint8_t *>(text.data());
}

bool isControl(ucs4_t character) {
    return uc_is_general_category_withtable(character, kControls);
}

// What could move a terminal's cursor, or make a text look like another one.
bool isTreacherous(ucs4_t character) {
    return isControl(character) || uc_is_property_bidi_control(character);
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

std::string printable(std::string_view text) {
    std::string result;
    forEachCharacter(text, [&](ucs4_t character) {
        uint8_t bytes[6];
        const ucs4_t shown = character == '\t'          ? ' '
                             : isTreacherous(character) ? kReplacement
                                                        : character;
        const int length = u8_uctomb(bytes, shown, sizeof bytes);
        result.append(reinterpret_cast<const char *>(bytes), static_cast<size_t>(length));
    });
    return result;
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
