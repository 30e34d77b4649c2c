// JSON as text.
#include "json/json.h"
#include "text/utf8.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <json/reader.h>
#include <json/writer.h>
#include <memory>
#include <new>

namespace tavisched {

namespace {

// Reads one text after the other: to make a reader takes longer than to read most texts.
Json::CharReader &reader(bool anyRoot) {
    const auto make = [](bool strictRoot) {
        Json::CharReaderBuilder builder;
        Json::CharReaderBuilder::strictMode(&builder.settings_);
        builder["strictRoot"] = strictRoot;
        return std::unique_ptr<Json::CharReader>(builder.newCharReader());
    };
    static const auto ofAny = make(false);
    static const auto ofWhole = make(true);
    return anyRoot ? *ofAny : *ofWhole;
}

} // namespace

std::optional<std::string> parseJson(const std::string &text, bool anyRoot, Json::Value &value) {
    std::string errors;
    errno = 0;
    try {
        if (reader(anyRoot).parse(text.data(), text.data() + text.size(), &value, &errors)) {
            return std::nullopt;
        }
    } catch (const Json::Exception &refusal) { // of deep nesting, or for lack of memory
        if (errno == ENOMEM) {
            throw std::bad_alloc();
        }
        errors = refusal.what();
    }
    std::replace(errors.begin(), errors.end(), '\n', ' ');
    return printable(errors);
}

namespace {

std::string write(const Json::Value &value, const char *indentation) {
    Json::StreamWriterBuilder builder;
    builder["indentation"] = indentation;
    builder["precision"] = 15;
    builder["emitUTF8"] = true;
    builder["enableYAMLCompatibility"] = true; // no blank before a colon
    return printableLines(Json::writeString(builder, value));
}

} // namespace

void printJson(const Json::Value &value) {
    std::printf("%s\n", write(value, "  ").c_str());
}

void printJsonLine(const Json::Value &value) {
    std::printf("%s\n", jsonLine(value).c_str());
}

std::string jsonLine(const Json::Value &value) {
    return write(value, "");
}

} // namespace tavisched
