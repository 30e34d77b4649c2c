// JSON as text: reading strictly, and writing so that it can go to a terminal.
#pragma once

#include <json/value.h>
#include <optional>
#include <string>

namespace tavisched {

// What is wrong with the text, or nothing when it is in `value`. A root that is no array or object
// is only accepted with `anyRoot`.
std::optional<std::string> parseJson(const std::string &text, bool anyRoot, Json::Value &value);
// Characters that could do harm on a terminal are written as escapes.
void printJson(const Json::Value &value);
// The same on one line.
void printJsonLine(const Json::Value &value);
// The same as a text without a line feed.
std::string jsonLine(const Json::Value &value);

} // namespace tavisched
