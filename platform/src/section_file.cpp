// Section files. Where the sections of a file begin and end follows from the lines that begin with
// "[" alone, and a section's pairs are split when it is asked for. Who asks for one section gets it
// out of a small window that moves along the file; all of them come from one reading of the whole.
#include "base/file.h"
#include "containers.h"
#include "file.h"
#include "platform.h"

#include <algorithm>
#include <ctime>
#include <memory>
#include <optional>
#include <span>
#include <tuple>
#include <unistd.h>
#include <unordered_map>
#include <unordered_set>
#include <utility>

namespace {

using platform::guarded;

// ---- The format ----

// A line that begins with "[" and what stands below it. No key begins so: each such line, also a
// damaged one, ends the section before it.
struct Section {
    std::string_view name;
    bool isDamaged = false; // its header has no name, and nobody reads it
    size_t header = 0;      // where the header line begins
    size_t body = 0;        // where the line after it begins
    size_t end = 0;         // where the next header begins
};

std::string_view lineAt(std::string_view text, size_t begin) {
    return text.substr(begin, text.find('\n', begin) - begin);
}

size_t afterLine(std::string_view text, size_t begin) {
    return std::min(text.find('\n', begin), text.size() - 1) + 1;
}

// "[" is rare, line feeds are not.
size_t headerFrom(std::string_view text, size_t from) {
    size_t found = text.find('[', from);
    while (found != std::string_view::npos && found != 0 && text[found - 1] != '\n') {
        found = text.find('[', found + 1);
    }
    return std::min(found, text.size());
}

// The name in a header line; blanks behind it, which a hand may have left, do not count. Nothing
// when the header is damaged.
std::optional<std::string_view> headerName(std::string_view line) {
    const size_t end = line.find_last_not_of(" \t\r");
    if (end == std::string_view::npos || end == 0 || line[end] != ']') {
        return std::nullopt;
    }
    return line.substr(1, end - 1);
}

// The section whose header begins at `from`, where a line begins, or behind it.
std::optional<Section> headedFrom(std::string_view text, size_t from) {
    const size_t header = headerFrom(text, from);
    if (header == text.size()) {
        return std::nullopt;
    }
    const auto name = headerName(lineAt(text, header));
    const size_t body = afterLine(text, header);
    return Section{.name = name.value_or(std::string_view()),
                   .isDamaged = !name,
                   .header = header,
                   .body = body,
                   .end = headerFrom(text, body)};
}

// The same for one that is read.
std::optional<Section> sectionFrom(std::string_view text, size_t from) {
    auto section = headedFrom(text, from);
    while (section && section->isDamaged) {
        section = headedFrom(text, section->end);
    }
    return section;
}

// The first section of that name, or nothing.
std::optional<Section> findFirst(std::string_view text, std::string_view name) {
    auto section = sectionFrom(text, 0);
    while (section && section->name != name) {
        section = sectionFrom(text, section->end);
    }
    return section;
}

template <typename Function>
void forEachPair(std::string_view text, const Section &section, Function &&onPair) {
    for (size_t at = section.body; at < section.end; at = afterLine(text, at)) {
        const std::string_view line = lineAt(text, at);
        const size_t equals = line.find('=');
        if (equals != std::string_view::npos && equals != 0) {
            onPair(line.substr(0, equals), line.substr(equals + 1));
        }
    }
}

void readPairs(std::string_view text, const Section &section, PLATCSZHASH &hash) {
    auto &pairs = hash.pairs;
    forEachPair(text, section, [&](std::string_view key, std::string_view value) {
        // Sections that this file wrote are in the map's order: the hint makes each insert
        // immediate.
        pairs.insert_or_assign(pairs.end(), std::string(key), std::string(value));
    });
}

// The same in the place of what the hash holds. Sections of one file mostly have the same keys, and
// then the values alone are new.
void replacePairs(std::string_view text, const Section &section, PLATCSZHASH &hash) {
    auto next = hash.pairs.begin();
    bool isSame = true;
    forEachPair(text, section, [&](std::string_view key, std::string_view value) {
        isSame = isSame && next != hash.pairs.end() && next->first == key;
        if (isSame) {
            (next++)->second = value;
        }
    });
    if (!isSame || next != hash.pairs.end()) {
        hash.pairs.clear();
        readPairs(text, section, hash);
    }
}

bool isWritable(std::string_view section, const PLATCSZHASH &hash) {
    if (section.find_first_of("]\n") != std::string_view::npos) {
        return false;
    }
    for (const auto &[key, value] : hash.pairs) {
        if (key.empty() || key.front() == '[' || key.find_first_of("=\n") != std::string::npos ||
            value.find('\n') != std::string::npos) {
            return false;
        }
    }
    return true;
}

void appendSection(std::string &text, std::string_view section, const PLATCSZHASH &hash) {
    if (!text.empty() && text.back() != '\n') {
        text += '\n';
    }
    text.append("[").append(section).append("]\n");
    for (const auto &[key, value] : hash.pairs) {
        text.append(key).append("=").append(value).append("\n");
    }
}

// Calls `onSection` for the first section of each name until it answers false.
template <typename Function> void forEachFirst(std::string_view text, Function &&onSection) {
    std::unordered_set<std::string_view> names;
    for (auto section = sectionFrom(text, 0); section; section = sectionFrom(text, section->end)) {
        if (names.insert(section->name).second && !onSection(*section)) {
            return;
        }
    }
}

// ---- One section alone ----

// The text of the first section of that name, empty when there is none; nothing when the file
// cannot be read to its end.
std::optional<std::string> readSectionText(const base::Opened &opened, std::string_view name) {
    constexpr size_t kLongest = 65536;
    const size_t step = std::min(kLongest, static_cast<size_t>(opened.status.st_size) + 1);
    std::string window; // begins where a line begins
    for (bool atEnd = false;;) {
        const auto section = findFirst(window, name);
        if (section && (atEnd || section->end < window.size())) {
            return window.substr(section->header, section->end - section->header);
        }
        if (atEnd) {
            return std::string();
        }
        window.erase(0, section ? section->header : window.rfind('\n') + 1);
        // A section larger than the window is looked at again as often as the window doubles.
        auto more = base::readSome(opened.file.get(), std::max(step, window.size()));
        if (!more) {
            return std::nullopt;
        }
        atEnd = more->empty();
        window += *more;
    }
}

// 1 found and read into the hash, 0 no such section, -1.
int readSection(const base::Opened &opened, std::string_view name, PLATCSZHASH &hash) {
    const auto text = readSectionText(opened, name);
    if (!text) {
        return PLATFORM_FAIL(platform::kReadWriteFailed);
    }
    const auto section = sectionFrom(*text, 0);
    if (section) {
        readPairs(*text, *section, hash);
    }
    return section ? 1 : 0;
}

// ---- Changes ----

// The text to be changed by a writer that makes a missing file. Nothing with the error state set.
std::optional<std::string> textToChange(const char *path) {
    const int there = platform::isThere(path);
    if (there <= 0) {
        return there == 0 ? std::optional<std::string>("") : std::nullopt;
    }
    auto content = platform::readFile(path);
    return content ? std::optional(std::move(content->text)) : std::nullopt;
}

struct Change {
    std::string_view name;
    const PLATCSZHASH *hash; // nullptr removes the section
};

// The text with the changes made in one pass. Further sections of a name that is changed, which a
// hand may have left, go; of changes with one name the last counts.
std::string changed(std::string_view text, std::span<const Change> changes) {
    std::unordered_map<std::string_view, const PLATCSZHASH *> byName;
    for (const Change &change : changes) {
        byName.insert_or_assign(change.name, change.hash);
    }
    // What is placed is not placed again.
    const auto place = [&](std::string &result, std::string_view name) {
        if (const PLATCSZHASH *const hash = std::exchange(byName.at(name), nullptr)) {
            appendSection(result, name, *hash);
        }
    };
    std::string result;
    result.reserve(text.size());
    size_t kept = 0;
    for (auto section = sectionFrom(text, 0); section; section = sectionFrom(text, section->end)) {
        if (byName.contains(section->name)) {
            result.append(text, kept, section->header - kept);
            kept = section->end;
            place(result, section->name);
        }
    }
    result.append(text, kept);
    for (const Change &change : changes) {
        place(result, change.name);
    }
    return result;
}

// 1 done, 0 when there is no such section, -1.
int changeExisting(const char *path, const Change &change) {
    const auto content = platform::readFile(path);
    if (!content) {
        return -1;
    }
    if (!findFirst(content->text, change.name)) {
        return 0;
    }
    return platform::replaceFile(path, changed(content->text, {&change, 1})) == 0 ? 1 : -1;
}

// ---- Faults ----

std::vector<std::string> faultsOf(std::string_view text) {
    std::vector<std::string> faults;
    std::unordered_set<std::string_view> names;
    size_t line = 1;
    size_t counted = 0;
    for (auto section = headedFrom(text, 0); section; section = headedFrom(text, section->end)) {
        const std::string_view passed = text.substr(counted, section->header - counted);
        line += static_cast<size_t>(std::count(passed.begin(), passed.end(), '\n'));
        counted = section->header;
        const std::string where = "line " + std::to_string(line) + ": ";
        if (section->isDamaged) {
            faults.push_back(where + "damaged header: " + std::string(lineAt(text, counted)));
        } else if (!names.insert(section->name).second) {
            faults.push_back(where + "section [" + std::string(section->name) +
                             "] stands more than once");
        }
    }
    return faults;
}

// ---- Listing ----

std::vector<std::string> namesOf(std::string_view text) {
    std::vector<std::string> names;
    forEachFirst(text, [&](const Section &section) {
        names.emplace_back(section.name);
        return true;
    });
    return names;
}

// Fills the list with what is found in the file: the number of texts, or -1.
int listTexts(const char *path, PLATCSZLIST **list,
              std::vector<std::string> (*textsOf)(std::string_view text)) {
    if (!path || !list || !*list) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded(
        [&] {
            const auto content = platform::readFile(path);
            if (!content) {
                return -1;
            }
            (*list)->texts = textsOf(content->text);
            return static_cast<int>((*list)->texts.size());
        },
        -1);
}

} // namespace

int PLATCFileEnumSection(const char *szPath, PLATCSZLIST **ppList) {
    return listTexts(szPath, ppList, namesOf);
}

int PLATCFileGetSection(const char *szPath, const char *szSection, PLATCSZHASH **ppHash) {
    if (!szPath || !szSection || !ppHash || !*ppHash) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded(
        [&] {
            const auto opened = platform::openFile(szPath);
            return opened ? readSection(*opened, szSection, **ppHash) : -1;
        },
        -1);
}

int PLATCFileForEachSection(const char *szPath,
                            int (*pfOnSection)(void *pContext, const char *szSection,
                                               PLATCSZHASH *pHash),
                            void *pContext) {
    if (!szPath || !pfOnSection) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded(
        [&] {
            const auto content = platform::readFile(szPath);
            if (!content) {
                return -1;
            }
            int calls = 0;
            PLATCSZHASH hash;
            forEachFirst(content->text, [&](const Section &section) {
                const std::string name(section.name);
                if (name.find('\0') != std::string::npos) {
                    return true;
                }
                replacePairs(content->text, section, hash);
                ++calls;
                return pfOnSection(pContext, name.c_str(), &hash) == 0;
            });
            return calls;
        },
        -1);
}

int PLATCFileSetSection(const char *szPath, const char *szSection, const PLATCSZHASH *pHash) {
    if (!szPath || !szSection || !pHash || !isWritable(szSection, *pHash)) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded([&] { return changeExisting(szPath, {szSection, pHash}); }, -1);
}

int PLATCFileAddSection(const char *szPath, const char *szSection, const PLATCSZHASH *pHash) {
    if (!szPath || !szSection || !pHash || !isWritable(szSection, *pHash)) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded(
        [&] {
            const auto old = textToChange(szPath);
            if (!old) {
                return -1;
            }
            std::string text(*old);
            appendSection(text, szSection, *pHash);
            return platform::replaceFile(szPath, text) == 0 ? 1 : -1;
        },
        -1);
}

int PLATCFileRemoveSection(const char *szPath, const char *szSection) {
    if (!szPath || !szSection) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded([&] { return changeExisting(szPath, {szSection, nullptr}); }, -1);
}

int PLATCFileEditSections(const char *szPath, int count, const char *const *rgszSections,
                          const PLATCSZHASH *const *rgHashes) {
    if (!szPath || count < 0 || (count > 0 && (!rgszSections || !rgHashes))) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded(
        [&] {
            std::vector<Change> changes;
            for (int i = 0; i < count; ++i) {
                if (!rgszSections[i] ||
                    (rgHashes[i] && !isWritable(rgszSections[i], *rgHashes[i]))) {
                    return PLATFORM_FAIL(platform::kInvalidArgument);
                }
                changes.push_back({rgszSections[i], rgHashes[i]});
            }
            const auto old = textToChange(szPath);
            return old ? platform::replaceFile(szPath, changed(*old, changes)) : -1;
        },
        -1);
}

int PLATCFileCheckSections(const char *szPath, PLATCSZLIST **ppFaults) {
    return listTexts(szPath, ppFaults, faultsOf);
}
