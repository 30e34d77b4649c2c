// Section files. A file is read whole and split at its headers; a section's pairs are split when it
// is asked for. The last file read is remembered, so that reading all of its sections by name takes
// one pass. It is served only while device, inode, size, times and the asking user are the same,
// and only when a change since could not have left the same times: within one tick of the file
// system's clock it could, and then the file is read again.
#include "containers.h"
#include "file.h"
#include "platform.h"

#include <ctime>
#include <memory>
#include <optional>
#include <tuple>
#include <unistd.h>
#include <unordered_map>

namespace {

using platform::guarded;

struct Section {
    std::string_view name;
    size_t header = 0; // where the header line begins
    size_t body = 0;   // where the line after it begins
    size_t end = 0;    // where the next header begins
};

class SectionFile {
  public:
    explicit SectionFile(std::string text);
    SectionFile(const SectionFile &) = delete;
    SectionFile &operator=(const SectionFile &) = delete;

    const std::string &text() const { return text_; }
    const std::vector<Section> &sections() const { return sections_; }
    // The first section of that name, or nothing.
    const Section *find(std::string_view name) const;

  private:
    std::string text_;
    std::vector<Section> sections_;
    std::unordered_map<std::string_view, size_t> byName_;
};

// Calls the function with each line (without its line feed) and the offsets of its begin and of the
// line after it.
template <typename Function>
void forEachLine(std::string_view text, size_t begin, size_t end, Function &&function) {
    while (begin < end) {
        const size_t feed = text.find('\n', begin);
        const size_t next = feed == std::string_view::npos ? text.size() : feed + 1;
        const size_t length = (feed == std::string_view::npos ? text.size() : feed) - begin;
        function(text.substr(begin, length), begin, next);
        begin = next;
    }
}

// The name in a header line; blanks behind it, which a hand may have left, do not count. Nothing
// when the line is none.
std::optional<std::string_view> headerName(std::string_view line) {
    const size_t end = line.find_last_not_of(" \t\r");
    if (end == std::string_view::npos || end == 0 || line[end] != ']') {
        return std::nullopt;
    }
    return line.substr(1, end - 1);
}

// No key begins with "[", so every line that does ends the section before it.
SectionFile::SectionFile(std::string text) : text_(std::move(text)) {
    bool open = false;
    forEachLine(text_, 0, text_.size(), [&](std::string_view line, size_t begin, size_t next) {
        if (!line.starts_with('[')) {
            return;
        }
        if (open) {
            sections_.back().end = begin;
        }
        const auto name = headerName(line);
        open = name.has_value();
        if (open) {
            sections_.push_back(
                {.name = *name, .header = begin, .body = next, .end = text_.size()});
            byName_.emplace(*name, sections_.size() - 1);
        }
    });
}

const Section *SectionFile::find(std::string_view name) const {
    const auto found = byName_.find(name);
    return found == byName_.end() ? nullptr : &sections_[found->second];
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

bool mayServeRemembered(const char *path) {
    struct stat status {};
    return remembered.settled && remembered.path == path && stat(path, &status) == 0 &&
           identityOf(status) == remembered.identity && changeWouldShow(status);
}

// The file as it is now; valid until the next call. Nothing with the error state set.
const SectionFile *load(const char *path) {
    if (mayServeRemembered(path)) {
        return remembered.file.get();
    }
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

void readPairs(const SectionFile &file, const Section &section, PLATCSZHASH &hash) {
    auto &pairs = hash.pairs;
    forEachLine(file.text(), section.body, section.end, [&](std::string_view line, size_t, size_t) {
        const size_t equals = line.find('=');
        if (equals == std::string_view::npos || equals == 0) {
            return;
        }
        const std::string_view key = line.substr(0, equals);
        const std::string_view value = line.substr(equals + 1);
        // Sections that this file wrote are in the map's order: the hint makes each insert
        // immediate.
        pairs.insert_or_assign(pairs.end(), std::string(key), std::string(value));
    });
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

// Rewrites the file with the section replaced by the hash's pairs, or removed when there is none.
// Further sections of the name, which a hand may have left, go.
int rewriteSection(const char *path, std::string_view name, const PLATCSZHASH *hash) {
    const SectionFile *file = load(path);
    if (!file) {
        return -1;
    }
    const Section *first = file->find(name);
    if (!first) {
        return 0;
    }
    std::string text;
    size_t kept = 0;
    for (const Section &section : file->sections()) {
        if (section.name == name) {
            text.append(file->text(), kept, section.header - kept);
            kept = section.end;
            if (hash && &section == first) {
                appendSection(text, name, *hash);
            }
        }
    }
    text.append(file->text(), kept);
    return platform::replaceFile(path, text) == 0 ? 1 : -1;
}

} // namespace

int PLATCFileEnumSection(const char *szPath, PLATCSZLIST **ppList) {
    if (!szPath || !ppList || !*ppList) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded(
        [&] {
            const SectionFile *file = load(szPath);
            if (!file) {
                return -1;
            }
            auto &texts = (*ppList)->texts;
            texts.clear();
            for (const Section &section : file->sections()) {
                if (file->find(section.name) == &section) {
                    texts.emplace_back(section.name);
                }
            }
            return static_cast<int>(texts.size());
        },
        -1);
}

int PLATCFileGetSection(const char *szPath, const char *szSection, PLATCSZHASH **ppHash) {
    if (!szPath || !szSection || !ppHash || !*ppHash) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded(
        [&] {
            const SectionFile *file = load(szPath);
            const Section *section = file ? file->find(szSection) : nullptr;
            if (!section) {
                return file ? 0 : -1;
            }
            readPairs(*file, *section, **ppHash);
            if (section == &file->sections().back()) {
                remembered =
                    {}; // a pass over all sections ends here, and so does the need for memory
            }
            return 1;
        },
        -1);
}

int PLATCFileSetSection(const char *szPath, const char *szSection, const PLATCSZHASH *pHash) {
    if (!szPath || !szSection || !pHash || !isWritable(szSection, *pHash)) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded([&] { return rewriteSection(szPath, szSection, pHash); }, -1);
}

int PLATCFileAddSection(const char *szPath, const char *szSection, const PLATCSZHASH *pHash) {
    if (!szPath || !szSection || !pHash || !isWritable(szSection, *pHash)) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded(
        [&] {
            std::string text;
            if (PLATCFileExist(szPath)) {
                const SectionFile *file = load(szPath);
                if (!file) {
                    return -1;
                }
                text = file->text();
            }
            appendSection(text, szSection, *pHash);
            return platform::replaceFile(szPath, text) == 0 ? 1 : -1;
        },
        -1);
}

int PLATCFileRemoveSection(const char *szPath, const char *szSection) {
    if (!szPath || !szSection) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded([&] { return rewriteSection(szPath, szSection, nullptr); }, -1);
}
