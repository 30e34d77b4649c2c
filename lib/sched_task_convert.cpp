// A task's stored form: a string hash with one pair for each row of the field table, in which no
// value spans lines and the command stands in base64.
#include "platc.h"
#include "sched_error.h"
#include "sched_field.h"
#include "sched_handle.h"
#include "sched_text.h"
#include "tavischeduler.h"
#include "tavisdk.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace {

using sched::Field;
using sched::FieldKind;
using sched::LogText;

using NumberText = std::array<char, 4096>;

int ToHashStr(const Field &field, const TAVI_SCHED_TASK &task, NumberText &text) {
    const size_t room = text.size() - 1;
    const int length =
        field.kind == FieldKind::Signed
            ? std::snprintf(text.data(), room, "%ld", static_cast<long>(field.signedIn(task)))
            : std::snprintf(text.data(), room, "%lu",
                            static_cast<unsigned long>(field.unsignedIn(task)));
    return length < 0 ? -1 : 0;
}

int fnFromHashStr(const Field &field, const char *text, TAVI_SCHED_TASK &task) {
    if (field.kind == FieldKind::Signed) {
        field.signedIn(task) = sched::signedFromText(text);
        return 0;
    }
    const auto number = sched::unsignedFromText(text);
    if (!number) {
        SCHED_SET_ERROR(sched::kBadFormat);
        return -1;
    }
    field.unsignedIn(task) = *number;
    return 0;
}

// The value's text for the hash; nothing for a number without a name, whose key is left out.
int valueText(size_t row, const TAVI_SCHED_TASK &task, NumberText &scratch, const char *&text) {
    const Field &field = sched::parm_table[row];
    switch (field.kind) {
    case FieldKind::Text:
        text = field.textIn(task);
        return 0;
    case FieldKind::Enum:
        text = TAVISchedEnumToName(field.enumTable, field.signedIn(task));
        return 0;
    default:
        text = scratch.data();
        if (ToHashStr(field, task, scratch) != 0) {
            SCHED_LOG("parm_table[%d].ToHashStr failed.", static_cast<int>(row));
            return -1;
        }
        return 0;
    }
}

int setFields(PLATCSZHASH **hash, const TAVI_SCHED_TASK &task) {
    NumberText scratch;
    for (size_t row = 0; row < sched::parm_table.size(); ++row) {
        const Field &field = sched::parm_table[row];
        const char *text = nullptr;
        if (!field.enabled) {
            continue;
        }
        if (valueText(row, task, scratch, text) != 0) {
            return -1;
        }
        if (text && PLATCSzHashSetValue(hash, field.key, text) != 0) {
            SCHED_LOG("Set hash value failed. key:[%s], val:[%s]. [0x%04X %s:%d]", field.key,
                      LogText(text).c_str(), SCHED_LAST_ERROR);
            return -1;
        }
    }
    return 0;
}

int encodeCommand(PLATCSZHASH **hash) {
    std::array<char, 32768> encoded;
    const char *const command = PLATCSzHashGetValue(*hash, "cmd");
    if (!command) {
        SCHED_LOG("Failed to get cmd in hash");
        return -1;
    }
    if (SzBase64EncodeFull(command, std::strlen(command), encoded.data(), encoded.size(), 0, 1) !=
        0) {
        SCHED_LOG("Base64 encoding failed. [%s] [0x%04X %s:%d]", LogText(command).c_str(),
                  SCHED_LAST_ERROR);
        return -1;
    }
    if (PLATCSzHashSetValue(hash, "cmd", encoded.data()) != 0) {
        SCHED_LOG("set hash failed. key:[cmd], val:[%s] [0x%04X %s:%d]",
                  LogText(encoded.data()).c_str(), SCHED_LAST_ERROR);
        return -1;
    }
    return 0;
}

// A section file keeps one line a value. The hash holds the table's keys and no others.
void replaceLineFeeds(PLATCSZHASH *hash) {
    for (const Field &field : sched::parm_table) {
        char *const value = PLATCSzHashGetValue(hash, field.key);
        for (char *feed = value; feed && (feed = std::strchr(feed, '\n'));) {
            *feed = ' ';
        }
    }
}

int fillField(size_t row, const char *text, TAVI_SCHED_TASK &task, const sched::Site &site) {
    const Field &field = sched::parm_table[row];
    if (field.kind == FieldKind::Text) {
        sched::copyText(field.textIn(task), field.size, text);
    } else if (field.kind == FieldKind::Enum) {
        // An unknown name leaves the field as it is, on purpose: the record holds a default.
        const int32_t value = TAVISchedEnumToValue(field.enumTable, text);
        if (value >= 0) {
            field.signedIn(task) = value;
        }
    } else if (fnFromHashStr(field, text, task) != 0) {
        SCHED_LOG_FOR(site, "parm_table[%d].fnFromHashStr failed.", static_cast<int>(row));
        return -1;
    }
    return 0;
}

int decodeCommand(TAVI_SCHED_TASK &task) {
    std::array<char, sizeof task.command> encoded;
    sched::copyText(encoded.data(), encoded.size(), task.command);
    size_t length = sizeof task.command;
    if (TAVIEncodingBase64Decode(encoded.data(), std::strlen(encoded.data()), task.command,
                                 &length) != 0) {
        SCHED_LOG("Base64 decoding failed. [%s] [0x%04X %s:%d]", LogText(encoded.data()).c_str(),
                  SCHED_LAST_ERROR);
        return -1;
    }
    // The encoded text is shorter than the field, so what it decodes to is shorter still.
    task.command[length] = '\0';
    return 0;
}

} // namespace

int32_t sched::signedFromText(const char *text) {
    const long value = std::strtol(text, nullptr, 10);
    return static_cast<int32_t>(std::clamp<long>(value, kAnySigned.low, kAnySigned.high));
}

std::optional<uint32_t> sched::unsignedFromText(const char *text) {
    constexpr auto kLargest = static_cast<unsigned long>(kAnyUnsigned.high);
    char *end = nullptr;
    const unsigned long value = std::strtoul(text, &end, 10);
    if (*end != '\0') {
        return std::nullopt;
    }
    const bool isNegative = value != 0 && std::strchr(text, '-') != nullptr;
    return static_cast<uint32_t>(isNegative ? kLargest : std::min(value, kLargest));
}

void sched::setNewTaskValues(PLATCSZHASH **hash, const char *name, const char *appName) {
    const std::array<std::array<const char *, 2>, 13> values = {{{"id", "-1"},
                                                                 {"name", name},
                                                                 {"run hour", "0"},
                                                                 {"run min", "0"},
                                                                 {"start year", "0"},
                                                                 {"start month", "0"},
                                                                 {"start day", "0"},
                                                                 {"app", ""},
                                                                 {"app name", appName},
                                                                 {"action", ""},
                                                                 {"cmd", ""},
                                                                 {"state", "enabled"},
                                                                 {"type", "daily"}}};
    for (const auto &[key, value] : values) {
        PLATCSzHashSetValue(hash, key, value);
    }
}

int sched::fillTaskFromHash(PLATCSZHASH *hash, TAVI_SCHED_TASK &task, const Site &site) {
    for (size_t row = 0; row < parm_table.size(); ++row) {
        const Field &field = parm_table[row];
        if (!field.enabled) {
            continue;
        }
        const char *text = PLATCSzHashGetValue(hash, field.key);
        if (!text && field.required) {
            SCHED_LOG_FOR(site, "Get hash value failed. key:[%s]. [0x%04X %s:%d]", field.key,
                          SCHED_LAST_ERROR);
            return -1;
        }
        if (fillField(row, text ? text : field.defaultText, task, site) != 0) {
            return -1;
        }
    }
    return 0;
}

int TAVISchedInitHashFromTask(PLATCSZHASH **ppHash, const TAVI_SCHED_TASK *pTask) {
    SCHED_REQUIRE(ppHash, "((void *)0) != ppHash", -1);
    SCHED_REQUIRE(*ppHash, "((void *)0) != *ppHash", -1);
    SCHED_REQUIRE(pTask, "NULL != pTask", -1);
    PLATCHashRemoveAll(*ppHash);
    if (setFields(ppHash, *pTask) != 0 || encodeCommand(ppHash) != 0) {
        return -1;
    }
    replaceLineFeeds(*ppHash);
    return 0;
}

int TAVISchedInitTaskFromHash(PLATCSZHASH *pHash, TAVI_SCHED_TASK *pTask) {
    SCHED_REQUIRE(pHash, "((void *)0) != pHash", -1);
    SCHED_REQUIRE(pTask, "NULL != pTask", -1);
    if (sched::fillTaskFromHash(pHash, *pTask, SCHED_SITE) != 0) {
        return -1;
    }
    return decodeCommand(*pTask);
}
