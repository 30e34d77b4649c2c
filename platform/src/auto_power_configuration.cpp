// The auto-power configuration: a section file with a section a kind and a pair an entry,
// "000=enabled week-bits hour minute".
#include "file.h"
#include "platform.h"
#include "tavisdk.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cstdio>
#include <memory>
#include <string>

namespace {

using platform::guarded;

constexpr const char *kConfiguration = "/usr/tavi/etc/auto_power";
constexpr std::array<const char *, 2> kSections = {"power on", "power off"};

bool isKind(int kind) {
    return kind == TAVI_AUTOPOWER_KIND_ON || kind == TAVI_AUTOPOWER_KIND_OFF;
}

const char *const *sectionOf(int kind) {
    return &kSections[static_cast<size_t>(kind)];
}

using Hash = std::unique_ptr<PLATCSZHASH, decltype(&PLATCSzHashFree)>;
using List = std::unique_ptr<PLATCSZLIST, decltype(&PLATCSzListFree)>;

std::string entryKey(int index) {
    std::array<char, 16> key{};
    std::snprintf(key.data(), key.size(), "%03d", index);
    return key.data();
}

// Four numbers from 0 to 255 with single blanks between them.
bool parseEntry(std::string_view text, TAVIAUTOPOWER &entry) {
    const char *at = text.data();
    const char *const end = at + text.size();
    for (uint8_t *field : {&entry.enabled, &entry.weekBits, &entry.hour, &entry.minute}) {
        if (field != &entry.enabled && (at == end || *at++ != ' ')) {
            return false;
        }
        const auto parsed = std::from_chars(at, end, *field);
        if (parsed.ec != std::errc()) {
            return false;
        }
        at = parsed.ptr;
    }
    return at == end;
}

int refuseConfiguration(int kind, const std::string &key) {
    PLATFORM_LOG("%s: entry [%s] in [%s] is missing or damaged", kConfiguration, key.c_str(),
                 *sectionOf(kind));
    return PLATFORM_FAIL(platform::kBadFormat);
}

// How many pairs the section has, read into the hash; 0 without a configuration.
int readSection(int kind, PLATCSZHASH **pairs) {
    const int there = platform::isThere(kConfiguration);
    if (there != 1) {
        return there;
    }
    List keys(PLATCSzListAlloc(TAVI_AUTOPOWER_MAX_ENTRIES), PLATCSzListFree);
    PLATCSZLIST *list = keys.get();
    const int found = PLATCFileGetSection(kConfiguration, *sectionOf(kind), pairs);
    return found <= 0 ? found : PLATCSzHashEnumKey(*pairs, &list);
}

// A gap in the numbering would hide the entries behind it, and the next change would erase them.
int readEntries(int kind, int max, TAVIAUTOPOWER *entries) {
    Hash hash(PLATCSzHashAlloc(max), PLATCSzHashFree);
    PLATCSZHASH *pairs = hash.get();
    const int stored = pairs ? readSection(kind, &pairs) : -1;
    const int count = std::min(stored, max);
    for (int i = 0; i < count; ++i) {
        const std::string key = entryKey(i);
        const char *const text = PLATCSzHashGetValue(pairs, key.c_str());
        if (!text || !parseEntry(text, entries[i])) {
            return refuseConfiguration(kind, key);
        }
    }
    return count;
}

int writeEntries(int kind, int count, const TAVIAUTOPOWER *entries) {
    const Hash hash(PLATCSzHashAlloc(count), PLATCSzHashFree);
    PLATCSZHASH *pairs = hash.get();
    for (int i = 0; i < count; ++i) {
        std::array<char, 32> text{};
        std::snprintf(text.data(), text.size(), "%u %u %u %u", entries[i].enabled,
                      entries[i].weekBits, entries[i].hour, entries[i].minute);
        if (PLATCSzHashSetValue(&pairs, entryKey(i).c_str(), text.data()) != 0) {
            return -1;
        }
    }
    return pairs ? PLATCFileEditSections(kConfiguration, 1, sectionOf(kind), &pairs) : -1;
}

} // namespace

int TAVIAutoPowerConfGet(int kind, int max, TAVIAUTOPOWER *rgEntries) {
    if (!isKind(kind) || max < 0 || !rgEntries) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded(
        [&] { return readEntries(kind, std::min(max, TAVI_AUTOPOWER_MAX_ENTRIES), rgEntries); },
        -1);
}

int TAVIAutoPowerConfSet(int kind, int count, const TAVIAUTOPOWER *rgEntries) {
    if (!isKind(kind) || count < 0 || (count > 0 && !rgEntries)) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded([&] { return writeEntries(kind, count, rgEntries); }, -1);
}
