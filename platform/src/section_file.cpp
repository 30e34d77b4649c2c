// Section files. A file is read whole; where its sections begin and end follows from the lines that
// begin with "[" alone, and a section's pairs are split when it is asked for. Who asks for one
// section or two gets them out of a small window that moves along the file. For who asks for more
// the file is read whole and remembered, so that reading all of its sections by name takes one
// pass. It is served only while device, inode, size, times and the asking user are the same, and
// only when a change since could not have left the same times: within one tick of the file system's
// clock it could, and then the file is read again.
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

void readPairs(std::string_view text, const Section &section, PLATCSZHASH &hash) {
    auto &pairs = hash.pairs;
    for (size_t at = section.body; at < section.end; at = afterLine(text, at)) {
        const std::string_view line = lineAt(text, at);
        const size_t equals = line.find('=');
        if (equals == std::string_view::npos || equals == 0) {
            continue;
        }
        const std::string_view key = line.substr(0, equals);
        const std::string_view value = line.substr(equals + 1);
        // Sections that this file wrote are in the map's order: the hint makes each insert
        // immediate.
        pairs.insert_or_assign(pairs.end(), std::string(key), std::string(value));
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

// ---- A file in memory ----

class SectionFile {
  public:
    explicit SectionFile(std::string text) : text_(std::move(text)) {}
    SectionFile(const SectionFile &) = delete;
    SectionFile &operator=(const SectionFile &) = delete;

    const std::string &text() const { return text_; }
    // The names in file order, each once.
    std::vector<std::string> names();
    // The first section of that name, or nothing.
    std::optional<Section> find(std::string_view name);

  private:
    using Index = std::unordered_map<std::string_view, Section>;

    const Index &index();

    std::string text_;
    Index index_; // the first section of each name; made when somebody asks
};

const SectionFile::Index &SectionFile::index() {
    if (index_.empty()) {
        Index whole; // an unfinished one would hide sections
        for (auto section = sectionFrom(text_, 0); section;
             section = sectionFrom(text_, section->end)) {
            whole.emplace(section->name, *section);
        }
        index_ = std::move(whole);
    }
    return index_;
}

std::vector<std::string> SectionFile::names() {
    std::vector<std::string> names;
    names.reserve(index().size());
    for (auto section = sectionFrom(text_, 0); section;
         section = sectionFrom(text_, section->end)) {
        if (index().at(section->name).header == section->header) {
            names.emplace_back(section->name);
        }
    }
    return names;
}

std::optional<Section> SectionFile::find(std::string_view name) {
    const auto found = index().find(name);
    return found == index().end() ? std::nullopt : std::optional(found->second);
}

using Identity = std::tuple<dev_t, ino_t, off_t, time_t, long, time_t, long, uid_t>;

Identity identityOf(const struct stat &status) {
    return {status.st_dev,          status.st_ino,
            status.st_size,         status.st_mtim.tv_sec,
            status.st_mtim.tv_nsec, status.st_ctim.tv_sec,
            status.st_ctim.tv_nsec, geteuid()};
}

// Whether a change at this moment or later would get another time than this one. File systems stamp
// by the kernel's tick, or by seconds when there are no nanoseconds.
bool wouldShow(const timespec &stamp, const timespec &now) {
    constexpr time_t kMargin = 2;
    if (stamp.tv_sec > now.tv_sec + kMargin) {
        return true;
    }
    if (stamp.tv_nsec == 0) {
        return stamp.tv_sec + kMargin <= now.tv_sec;
    }
    return std::tie(stamp.tv_sec, stamp.tv_nsec) < std::tie(now.tv_sec, now.tv_nsec);
}

bool changeWouldShow(const struct stat &status) {
    timespec now{};
    clock_gettime(CLOCK_REALTIME_COARSE, &now);
    return wouldShow(status.st_mtim, now) && wouldShow(status.st_ctim, now);
}

struct Remembered {
    std::string path;
    Identity identity;
    bool settled = false; // a change after the reading shows in the identity
    std::unique_ptr<SectionFile> file;
};

Remembered remembered;

// What is remembered of the file, as long as it may be served.
SectionFile *recall(const char *path) {
    struct stat status {};
    const bool serves = remembered.settled && remembered.path == path && stat(path, &status) == 0 &&
                        identityOf(status) == remembered.identity && changeWouldShow(status);
    return serves ? remembered.file.get() : nullptr;
}

// The file as it is now, read anew. Nothing with the error state set.
SectionFile *remember(const char *path) {
    remembered.settled = false;
    struct stat before {};
    const bool settled = stat(path, &before) == 0 && changeWouldShow(before);
    auto content = platform::readFile(path);
    if (!content) {
        return nullptr;
    }
    if (!remembered.file || remembered.file->text() != content->text) {
        remembered.file = std::make_unique<SectionFile>(std::move(content->text));
    }
    remembered.path = path;
    remembered.identity = identityOf(content->status);
    remembered.settled = settled && identityOf(before) == remembered.identity;
    return remembered.file.get();
}

// The file as it is now; valid until the next call. Nothing with the error state set.
SectionFile *load(const char *path) {
    SectionFile *const recalled = recall(path);
    return recalled ? recalled : remember(path);
}

// ---- One section alone ----

// The text of the first section of that name, empty when there is none; nothing when the file
// cannot be read to its end.
std::optional<std::string> readSectionText(int fd, std::string_view name) {
    constexpr size_t kStep = 65536;
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
        auto more = base::readSome(fd, std::max(kStep, window.size()));
        if (!more) {
            return std::nullopt;
        }
        atEnd = more->empty();
        window += *more;
    }
}

// How often sections of a file that is not remembered were asked for.
struct Asked {
    Identity identity;
    int times = 0;
};

Asked asked;

bool asksForMore(const struct stat &status) {
    constexpr int kTimesAlone = 2;
    if (asked.identity != identityOf(status)) {
        asked = {.identity = identityOf(status), .times = 0};
    }
    return asked.times++ >= kTimesAlone;
}

// 1 found and read into the hash, 0 no such section, -1.
int readSectionAlone(const base::Opened &opened, std::string_view name, PLATCSZHASH &hash) {
    const auto text = readSectionText(opened.file.get(), name);
    if (!text) {
        return PLATFORM_FAIL(platform::kReadWriteFailed);
    }
    const auto section = sectionFrom(*text, 0);
    if (section) {
        readPairs(*text, *section, hash);
    }
    return section ? 1 : 0;
}

int readSectionOf(SectionFile &file, std::string_view name, PLATCSZHASH &hash) {
    const auto section = file.find(name);
    if (!section) {
        return 0;
    }
    readPairs(file.text(), *section, hash);
    if (!sectionFrom(file.text(), section->end)) {
        remembered = {}; // a pass over all sections ends here: so does the need for memory
    }
    return 1;
}

// ---- Changes ----

// The text to be changed by a writer that makes a missing file. Nothing with the error state set.
std::optional<std::string_view> textToChange(const char *path) {
    const int there = platform::isThere(path);
    const SectionFile *const file = there == 1 ? load(path) : nullptr;
    if (there < 0 || (there == 1 && !file)) {
        return std::nullopt;
    }
    return file ? std::string_view(file->text()) : std::string_view();
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
    const SectionFile *const file = load(path);
    if (!file) {
        return -1;
    }
    if (!findFirst(file->text(), change.name)) {
        return 0;
    }
    return platform::replaceFile(path, changed(file->text(), {&change, 1})) == 0 ? 1 : -1;
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

} // namespace

int PLATCFileEnumSection(const char *szPath, PLATCSZLIST **ppList) {
    if (!szPath || !ppList || !*ppList) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded(
        [&] {
            SectionFile *const file = load(szPath);
            if (!file) {
                return -1;
            }
            (*ppList)->texts = file->names();
            return static_cast<int>((*ppList)->texts.size());
        },
        -1);
}

int PLATCFileGetSection(const char *szPath, const char *szSection, PLATCSZHASH **ppHash) {
    if (!szPath || !szSection || !ppHash || !*ppHash) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded(
        [&] {
            SectionFile *file = recall(szPath);
            if (!file) {
                const auto opened = platform::openFile(szPath);
                if (!opened || !asksForMore(opened->status)) {
                    return opened ? readSectionAlone(*opened, szSection, **ppHash) : -1;
                }
                file = remember(szPath);
            }
            return file ? readSectionOf(*file, szSection, **ppHash) : -1;
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
    if (!szPath || !ppFaults || !*ppFaults) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded(
        [&] {
            const auto content = platform::readFile(szPath);
            if (!content) {
                return -1;
            }
            (*ppFaults)->texts = faultsOf(content->text);
            return static_cast<int>((*ppFaults)->texts.size());
        },
        -1);
}
