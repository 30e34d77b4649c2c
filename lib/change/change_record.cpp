// The durable record of a change.
#include "change_record.h"
#include "base/file.h"
#include "base/trust.h"
#include "change_lock.h"
#include "sched_error.h"
#include "sched_paths.h"

#include <cinttypes>
#include <cstdio>
#include <fcntl.h>
#include <sstream>
#include <unistd.h>

namespace sched {

namespace {

constexpr const char *kEndFormat = "#change pid=%d size=%zu tasks=%d working=%d persistent=%d "
                                   "sum=%" PRIx64 "\n";
constexpr std::string_view kEndMark = "\n#change ";

// Whether the persistent file was there, and like the working copy.
enum class Persistent { Missing, Same, Other };

int fail(unsigned int code, const char *what, const char *path) {
    SCHED_LOG("%s %s: %m", path, what);
    SCHED_SET_ERROR(code);
    return -1;
}

// ---- Text ----

// FNV-1a: what a loss of power left of a record must not pass for one.
uint64_t sumOf(std::string_view text) {
    uint64_t sum = 0xcbf29ce484222325;
    for (const char character : text) {
        sum = (sum ^ static_cast<unsigned char>(character)) * 0x100000001b3;
    }
    return sum;
}

std::string powerLines(const PowerEntries &power) {
    std::string text;
    for (size_t kind = 0; kind < power.size(); ++kind) {
        if (!power[kind]) {
            continue;
        }
        text += "#power " + std::to_string(kind) + "\n";
        for (const TAVIAUTOPOWER &entry : *power[kind]) {
            std::array<char, 64> line{};
            std::snprintf(line.data(), line.size(), "#entry %u %u %u %u\n", entry.enabled,
                          entry.weekBits, entry.hour, entry.minute);
            text += line.data();
        }
    }
    return text;
}

PowerEntries parsePowerLines(const std::string &text) {
    PowerEntries power;
    std::optional<std::vector<TAVIAUTOPOWER>> *kind = nullptr;
    std::istringstream lines(text);
    for (std::string line; std::getline(lines, line);) {
        size_t number = 0;
        TAVIAUTOPOWER entry{};
        if (std::sscanf(line.c_str(), "#power %zu", &number) == 1 && number < power.size()) {
            kind = &power[number];
            kind->emplace();
        } else if (kind && std::sscanf(line.c_str(), "#entry %hhu %hhu %hhu %hhu", &entry.enabled,
                                       &entry.weekBits, &entry.hour, &entry.minute) == 4) {
            (*kind)->push_back(entry);
        }
    }
    return power;
}

Persistent stateOfPersistent(const Before::Tasks &tasks) {
    return !tasks.persistent                   ? Persistent::Missing
           : tasks.persistent == tasks.working ? Persistent::Same
                                               : Persistent::Other;
}

std::string textOf(const Before &before) {
    const bool hasWorking = before.tasks && before.tasks->working;
    std::string text = hasWorking ? *before.tasks->working : std::string();
    const size_t size = text.size();
    text += "\n" + powerLines(before.power);
    std::array<char, 256> end{};
    const auto persistent = before.tasks ? stateOfPersistent(*before.tasks) : Persistent::Missing;
    std::snprintf(end.data(), end.size(), kEndFormat, static_cast<int>(getpid()), size,
                  before.tasks ? 1 : 0, hasWorking ? 1 : 0, static_cast<int>(persistent),
                  sumOf(text));
    return text + end.data();
}

// ---- Files ----

// Owner and mode are those of the file whose place it may take.
bool writeDurably(const char *path, std::string_view content) {
    base::Descriptor file(open(path, O_WRONLY | O_CREAT | O_TRUNC | O_NOFOLLOW | O_CLOEXEC, 0600));
    if (!file) {
        return false;
    }
    struct stat like {};
    const bool hasLike = stat(kPersistent, &like) == 0;
    return base::writeAll(file.get(), content) &&
           (!hasLike || (fchown(file.get(), like.st_uid, like.st_gid) == 0 &&
                         fchmod(file.get(), like.st_mode & ALLPERMS) == 0)) &&
           fsync(file.get()) == 0 && file.close();
}

std::optional<std::string> readTrusted(const char *path, base::Found &found) {
    const base::Opened opened = base::openTrusted(path, base::kSharedFileToRead);
    found = opened.found;
    if (found != base::Found::Trusted) {
        return std::nullopt;
    }
    auto content = base::readAll(opened.file.get());
    found = content ? found : base::Found::Unreadable;
    return content;
}

// Whether the path has just this content, or is not there when there is none.
bool isLike(const char *path, const std::optional<std::string> &content) {
    auto found = base::Found::Nothing;
    const auto present = readTrusted(path, found);
    return content ? present == content : found == base::Found::Nothing;
}

int removeFile(const char *path) {
    return unlink(path) == 0 || errno == ENOENT ? 0 : fail(kReadWriteFailed, "cannot go", path);
}

// ---- Restoring ----

// For a file system without room for both: what the torn copy took is room too.
bool overwriteWorking(const std::string &content) {
    base::Descriptor file(
        open(kWorkingCopy, O_WRONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    struct stat status {};
    return file && fstat(file.get(), &status) == 0 && base::isTrusted(status, base::kSharedFile) &&
           ftruncate(file.get(), 0) == 0 && base::writeAll(file.get(), content) && file.close();
}

int restoreWorking(const std::optional<std::string> &content) {
    if (isLike(kWorkingCopy, content)) {
        return 0;
    }
    const WritingLock lock;
    if (!lock) {
        return -1;
    }
    if (!content) {
        return removeFile(kWorkingCopy);
    }
    return replaceWorkingCopy(*content) || overwriteWorking(*content)
               ? 0
               : fail(kReadWriteFailed, "cannot be restored", kWorkingCopy);
}

// Renames need no room, and the record is gone with them.
int putInPlace(size_t size) {
    if ((rename(kRecord, kRestoring) != 0 && errno != ENOENT) ||
        truncate(kRestoring, static_cast<off_t>(size)) != 0 ||
        rename(kRestoring, kPersistent) != 0) {
        return fail(kRenameFailed, "cannot be restored", kPersistent);
    }
    return 0;
}

int restorePersistentFile(const Before::Tasks &tasks) {
    if (isLike(kPersistent, tasks.persistent)) {
        return 0;
    }
    switch (stateOfPersistent(tasks)) {
    case Persistent::Missing:
        return removeFile(kPersistent);
    case Persistent::Same:
        return putInPlace(tasks.working->size());
    case Persistent::Other:
        break;
    }
    return rename(kRecordPersistent, kPersistent) == 0
               ? 0
               : fail(kRenameFailed, "cannot be restored", kPersistent);
}

int restorePower(const PowerEntries &power) {
    for (size_t kind = 0; kind < power.size(); ++kind) {
        if (power[kind] &&
            TAVIAutoPowerConfSet(static_cast<int>(kind), static_cast<int>(power[kind]->size()),
                                 power[kind]->data()) < 0) {
            SCHED_LOG("power schedules cannot be restored. [0x%04X %s:%d]", SCHED_LAST_ERROR);
            return -1;
        }
    }
    return 0;
}

// What lies behind the tasks; in a file that is only tasks any more, nothing does.
Record parseRecord(const std::string &text) {
    Record record;
    record.size = text.size();
    int tasks = 0;
    int working = 0;
    int persistent = 0;
    uint64_t sum = 0;
    const size_t end = text.rfind(kEndMark);
    record.isWhole = end != std::string::npos &&
                     std::sscanf(text.c_str() + end + 1, kEndFormat, &record.process, &record.size,
                                 &tasks, &working, &persistent, &sum) == 6 &&
                     record.size <= end && sumOf(text.substr(0, end + 1)) == sum;
    if (!record.isWhole) {
        return record;
    }
    record.before.power = parsePowerLines(text.substr(record.size));
    if (tasks == 0) {
        return record;
    }
    Before::Tasks &before = record.before.tasks.emplace();
    if (working != 0) {
        before.working = text.substr(0, record.size);
    }
    auto found = base::Found::Nothing;
    if (persistent == static_cast<int>(Persistent::Same)) {
        before.persistent = before.working;
    } else if (persistent == static_cast<int>(Persistent::Other)) {
        // It has taken its place already when a restoration was cut off.
        before.persistent = readTrusted(kRecordPersistent, found);
        if (found == base::Found::Nothing) {
            before.persistent = readTrusted(kPersistent, found);
        }
        record.isReadable = before.persistent.has_value();
    }
    return record;
}

} // namespace

bool replaceWorkingCopy(const std::string &content) {
    const base::PrivateFolder folder(kWorkingCopy);
    const std::string made = folder.path() + "/file";
    if (!folder || !base::makeEmpty(made.c_str())) {
        return false;
    }
    struct stat like {};
    const bool keeps = lstat(kWorkingCopy, &like) == 0 && base::isTrusted(like, base::kSharedFile);
    base::Descriptor file(open(made.c_str(), O_WRONLY | O_CLOEXEC));
    return file && base::writeAll(file.get(), content) &&
           (!keeps || (fchown(file.get(), like.st_uid, like.st_gid) == 0 &&
                       fchmod(file.get(), like.st_mode & ALLPERMS) == 0)) &&
           file.close() && base::exchange(made.c_str(), kWorkingCopy);
}

RecordState recordState() {
    for (const char *const path : {kRecord, kRestoring}) {
        switch (base::look(path, base::kSharedFileToRead)) {
        case base::Found::Nothing:
            break;
        case base::Found::Trusted:
            return RecordState::Present;
        case base::Found::Strange:
            errno = EPERM;
            return RecordState::Unreadable;
        case base::Found::Unreadable:
            // A folder that this user may not look into has no record to obey.
            if (errno != ENOTDIR && errno != EACCES) {
                return RecordState::Unreadable;
            }
        }
    }
    return RecordState::None;
}

int writeRecord(const Before &before) {
    const bool other = before.tasks && stateOfPersistent(*before.tasks) == Persistent::Other;
    if ((!other || writeDurably(kRecordPersistent, *before.tasks->persistent)) &&
        writeDurably(kRecord, textOf(before)) && base::syncFolderOf(kRecord)) {
        return 0;
    }
    const int result = fail(kReadWriteFailed, "cannot be written, and nothing is changed", kRecord);
    unlink(kRecord);
    unlink(kRecordPersistent);
    return result;
}

// A record whose going cannot be made durable is there again: the change is taken back then.
int removeRecord() {
    if (rename(kRecord, kFinished) != 0 && errno != ENOENT) {
        return fail(kRenameFailed, "cannot go", kRecord);
    }
    if (!base::syncFolderOf(kRecord)) {
        const int result = fail(kReadWriteFailed, "cannot go for good", kRecord);
        rename(kFinished, kRecord);
        return result;
    }
    unlink(kFinished);
    unlink(kRecordPersistent);
    return 0;
}

std::optional<Record> readRecord() {
    auto found = base::Found::Nothing;
    auto text = readTrusted(kRecord, found);
    const bool isInPlace = !text && found == base::Found::Nothing;
    if (isInPlace) {
        text = readTrusted(kRestoring, found);
    }
    if (!text) {
        fail(kOpenFailed, "cannot be read", kRecord);
        return std::nullopt;
    }
    Record record = parseRecord(*text);
    record.isInPlace = isInPlace;
    if (!record.isReadable) {
        fail(kOpenFailed, "cannot be read", kRecordPersistent);
        return std::nullopt;
    }
    return record;
}

int restoreWhatIsRead(const Record &record) {
    const Before &before = record.before;
    if (record.isWhole && !record.isInPlace &&
        ((before.tasks && restoreWorking(before.tasks->working) != 0) ||
         restorePower(before.power) != 0)) {
        return -1;
    }
    tellWorkingCopyIsWhole();
    return 0;
}

int restorePersistent(const Record &record) {
    const Before &before = record.before;
    const int restored = record.isInPlace                 ? putInPlace(record.size)
                         : record.isWhole && before.tasks ? restorePersistentFile(*before.tasks)
                                                          : 0;
    return restored == 0 ? removeRecord() : -1;
}

bool recordHasTasks() {
    const auto record = readRecord();
    return record && record->isWhole && record->before.tasks && record->before.tasks->working;
}

} // namespace sched
