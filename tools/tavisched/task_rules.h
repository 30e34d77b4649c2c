// What a task must fulfil to be stored by this program. The library stores what it is given; people
// make slips.
#pragma once

#include "tavischeduler.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace tavisched {

constexpr size_t kMaxCommandBytes = 12285; // a longer one cannot be stored

// What is wrong with a task: the stored key of the field, and a text that says what is wrong and
// what is accepted.
struct Fault {
    std::string_view key;
    std::string what;
};

// The first fault, or nothing.
std::optional<Fault> findFault(const TAVI_SCHED_TASK &task);

// What is wrong with a text that a person gave for a field of so many bytes (with its end).
std::optional<std::string> faultOfText(std::string_view text, size_t fieldSize);
std::optional<std::string> faultOfCommand(std::string_view command);

// A year in which every day of the year is there.
constexpr uint32_t kAnyYear = 2012;

// The days of a month; 29 for a February without a year.
uint32_t daysInMonth(uint32_t month, std::optional<uint32_t> year = std::nullopt);

} // namespace tavisched
