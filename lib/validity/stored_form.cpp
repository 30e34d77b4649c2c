// What a stored form may hold: a value is good when the task that is read from it would be written
// with the same text.
#include "platc.h"
#include "sched_error.h"
#include "sched_guard.h"
#include "sched_handle.h"
#include "tavisdk.h"
#include "validity/fault.h"
#include "validity/utf8.h"

#include <algorithm>
#include <cstring>
#include <optional>
#include <string>
#include <string_view>

namespace {

using sched::Field;
using sched::FieldKind;

struct ValueFault {
    int kind;
    std::string reason;
};
using Fault = std::optional<ValueFault>;

// ---- Values ----

Fault faultOfNumber(const Field &field, const char *text) {
    std::string stored;
    if (field.kind == FieldKind::Signed) {
        stored = std::to_string(sched::signedFromText(text));
    } else if (const auto number = sched::unsignedFromText(text)) {
        stored = std::to_string(*number);
    } else {
        return ValueFault{TAVI_SCHED_FAULT_UNREADABLE,
                          sched::quoted(text) + " is no number that can be stored"};
    }
    if (stored == text) {
        return std::nullopt;
    }
    return ValueFault{TAVI_SCHED_FAULT_VALUE,
                      sched::quoted(text) + " would be stored as " + sched::quoted(stored)};
}

Fault faultOfName(const Field &field, std::string_view text) {
    for (const auto *row = field.enumTable; row->name; ++row) {
        if (text == row->name) {
            return std::nullopt;
        }
    }
    return ValueFault{TAVI_SCHED_FAULT_VALUE, sched::quoted(text) + " would be stored as " +
                                                  sched::quoted(field.defaultText) +
                                                  "; accepted: " + sched::acceptedNames(field)};
}

// Nothing for a text that is not base64 or too long for the field.
std::optional<std::string> decoded(const Field &field, std::string_view text) {
    std::string command(field.size, '\0');
    size_t length = command.size();
    if (text.size() >= field.size ||
        TAVIEncodingBase64Decode(text.data(), text.size(), command.data(), &length) != 0) {
        return std::nullopt;
    }
    command.resize(std::min(length, command.find('\0')));
    return command;
}

std::string encoded(const std::string &command) {
    std::string text((command.size() + 2) / 3 * 4 + 1, '\0');
    const int result =
        SzBase64EncodeFull(command.c_str(), command.size(), text.data(), text.size(), 0, 1);
    return result == 0 ? text.c_str() : "";
}

Fault faultOfCommand(const Field &field, std::string_view text) {
    const auto command = decoded(field, text);
    if (command && encoded(*command) == text) {
        return std::nullopt;
    }
    return ValueFault{command ? TAVI_SCHED_FAULT_VALUE : TAVI_SCHED_FAULT_UNREADABLE,
                      sched::quoted(text) + " is not the base64 text of a command of at most " +
                          std::to_string(TAVI_SCHED_MAX_COMMAND) + " bytes"};
}

Fault faultOfStoredText(const Field &field, std::string_view text) {
    if (text.size() >= field.size) {
        return ValueFault{TAVI_SCHED_FAULT_VALUE, std::to_string(text.size()) +
                                                      " bytes; accepted: at most " +
                                                      std::to_string(field.size - 1)};
    }
    return text.find('\n') == std::string_view::npos
               ? std::nullopt
               : Fault({TAVI_SCHED_FAULT_VALUE, sched::kHoldsLineBreak});
}

Fault faultOfValue(const Field &field, const char *text) {
    switch (field.kind) {
    case FieldKind::Text:
        return sched::isCommand(field) ? faultOfCommand(field, text)
                                       : faultOfStoredText(field, text);
    case FieldKind::Enum:
        return faultOfName(field, text);
    default:
        return faultOfNumber(field, text);
    }
}

// ---- Keys ----

// The row of a key of the stored form, or NULL.
const Field *findField(std::string_view key) {
    const auto *const field =
        std::find_if(sched::parm_table.begin(), sched::parm_table.end(),
                     [key](const Field &row) { return row.enabled && row.key == key; });
    return field == sched::parm_table.end() ? nullptr : field;
}

ValueFault unknownKey() {
    std::string keys;
    for (const Field &field : sched::parm_table) {
        if (field.enabled) {
            keys += (keys.empty() ? "" : ", ") + std::string(field.key);
        }
    }
    return {TAVI_SCHED_FAULT_UNKNOWN_KEY, "no task has it; accepted: " + keys};
}

// ---- A whole form ----

// Fills in as many faults as there is room for and counts them all.
class Faults {
  public:
    Faults(TAVI_SCHED_FAULT *faults, size_t room) : faults_(faults), room_(room) {}
    void add(const char *key, const ValueFault &fault) {
        if (count_ < room_) {
            sched::setFault(faults_[count_], fault.kind, key, fault.reason);
        }
        ++count_;
    }
    int count() const { return static_cast<int>(count_); }

  private:
    TAVI_SCHED_FAULT *faults_;
    size_t room_;
    size_t count_ = 0;
};

void checkFields(PLATCSZHASH *hash, Faults &faults) {
    for (const Field &field : sched::parm_table) {
        if (!field.enabled) {
            continue;
        }
        if (const char *const text = PLATCSzHashGetValue(hash, field.key)) {
            if (const auto fault = faultOfValue(field, text)) {
                faults.add(field.key, *fault);
            }
        } else if (field.required) {
            faults.add(field.key, {TAVI_SCHED_FAULT_MISSING, "it is missing"});
        }
    }
}

int checkHash(PLATCSZHASH *hash, Faults faults) {
    checkFields(hash, faults);
    sched::List keys(static_cast<int>(sched::parm_table.size()));
    const int count = keys ? PLATCSzHashEnumKey(hash, keys.address()) : -1;
    if (count < 0) {
        SCHED_LOG("enum hash key failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    for (int i = 0; i < count; ++i) {
        const char *const key = PLATCSzListGet(keys.get(), i);
        if (!findField(key)) {
            faults.add(key, unknownKey());
        }
    }
    return faults.count();
}

} // namespace

int TAVISchedValueCheck(const char *szKey, const char *szValue, TAVI_SCHED_FAULT *pFault) {
    SCHED_REQUIRE(szKey, "((void *)0) != szKey", -1);
    SCHED_REQUIRE(szValue, "((void *)0) != szValue", -1);
    SCHED_REQUIRE(pFault, "((void *)0) != pFault", -1);
    return sched::guarded(SCHED_SITE, [&] {
        const Field *const field = findField(szKey);
        const auto fault = field ? faultOfValue(*field, szValue) : unknownKey();
        if (fault) {
            sched::setFault(*pFault, fault->kind, szKey, fault->reason);
        }
        return fault ? 1 : 0;
    });
}

int TAVISchedHashCheck(PLATCSZHASH *pHash, TAVI_SCHED_FAULT *rgFaults, size_t cFaults) {
    SCHED_REQUIRE(pHash, "((void *)0) != pHash", -1);
    SCHED_REQUIRE(rgFaults || cFaults == 0, "((void *)0) != rgFaults", -1);
    return sched::guarded(SCHED_SITE, [&] { return checkHash(pHash, {rgFaults, cFaults}); });
}
