// The task file, as a hand may have left it: sections by name and one after the other, through a
// small window and from memory, the list and the look-up by id, and what a change leaves of the
// rest.
#include "fuzz.h"

#include <algorithm>
#include <charconv>
#include <optional>

namespace {

using fuzz::Pairs;

// The same file, read line by line. A text ends at its first NUL for those who ask.
struct Section {
    std::string name;
    Pairs pairs;
    size_t begin = 0;
    size_t end = 0;
    bool isDamaged = false;
};

std::string cut(const std::string &text) {
    return text.c_str();
}

std::vector<Section> parse(const std::string &content) {
    std::vector<Section> sections;
    size_t at = 0;
    for (std::string line : fuzz::linesOf(content)) {
        const size_t begin = at;
        at += line.size();
        if (line.back() == '\n') {
            line.pop_back();
        }
        if (line.starts_with('[')) {
            const size_t end = line.find_last_not_of(" \t\r");
            const bool isDamaged = end == 0 || line[end] != ']';
            sections.push_back(
                {isDamaged ? "" : line.substr(1, end - 1), {}, begin, at, isDamaged});
        } else if (!sections.empty()) {
            sections.back().end = at;
            const size_t equals = line.find('=');
            if (equals != std::string::npos && equals > 0) {
                sections.back().pairs[line.substr(0, equals)] = cut(line.substr(equals + 1));
            }
        }
    }
    return sections;
}

const Section *find(const std::vector<Section> &sections, const std::string &name) {
    const auto found = std::find_if(sections.begin(), sections.end(), [&](const Section &section) {
        return !section.isDamaged && section.name == name;
    });
    return found == sections.end() ? nullptr : &*found;
}

std::vector<std::string> namesOf(const std::vector<Section> &sections) {
    std::vector<std::string> names;
    for (const Section &section : sections) {
        if (find(sections, section.name) == &section) {
            names.push_back(section.name);
        }
    }
    return names;
}

bool hasNul(const Pairs &pairs) {
    return std::any_of(pairs.begin(), pairs.end(),
                       [](const auto &pair) { return pair.first.find('\0') != std::string::npos; });
}

void requireSection(const std::vector<Section> &sections, const std::string &name) {
    const Section *const expected = find(sections, name);
    const fuzz::Hash hash = fuzz::hashOf({});
    PLATCSZHASH *pairs = hash.get();
    REQUIRE(PLATCFileGetSection(fuzz::kWorking, name.c_str(), &pairs) == (expected ? 1 : 0));
    REQUIRE(!expected || hasNul(expected->pairs) || fuzz::pairsOf(pairs) == expected->pairs);
}

// Nothing for a name that is no id of the schedule backend.
std::optional<int32_t> idOf(const std::string &name) {
    int32_t id = 0;
    std::from_chars(name.data(), name.data() + name.size(), id);
    return std::to_string(id) == name && (id < 60'000'000 || id > 99'999'999) ? std::optional(id)
                                                                              : std::nullopt;
}

// The list has the tasks of all sections that can be read, and each is found by its section's name.
void requireTasks(const std::vector<Section> &sections) {
    int readable = 0;
    for (const std::string &name : namesOf(sections)) {
        if (cut(name) != name) {
            continue;
        }
        const Section *const section = find(sections, name);
        const fuzz::Task task = fuzz::newTask();
        const bool isReadable =
            section && !hasNul(section->pairs) &&
            TAVISchedInitTaskFromHash(fuzz::hashOf(section->pairs).get(), task.get()) == 0;
        readable += isReadable ? 1 : 0;
        const auto id = idOf(name);
        if (!id || !section || hasNul(section->pairs)) {
            continue;
        }
        const fuzz::Task found = fuzz::newTask();
        REQUIRE((TAVISchedTaskGetByID(*id, found.get()) == 0) == isReadable);
        if (isReadable) {
            Pairs expected = fuzz::formOf(*task);
            Pairs present = fuzz::formOf(*found);
            if (TAVISchedEnumToValue(TAVISchedStateTable, section->pairs.at("state").c_str()) < 0) {
                expected.erase("state");
                present.erase("state");
            }
            REQUIRE(expected == present);
        }
    }
    const bool all = std::none_of(sections.begin(), sections.end(),
                                  [](const Section &section) { return hasNul(section.pairs); });
    int given = 0;
    const int count = fuzz::listTasks([&](const TAVI_SCHED_TASK &task) {
        ++given;
        REQUIRE(task.nextTriggerTime[0] != '\0');
    });
    REQUIRE(count == given && (!all || count == readable));
}

void requireFaults(const std::string &content, const std::vector<Section> &sections) {
    std::vector<std::string> expected;
    for (const Section &section : sections) {
        const auto line = std::count(content.begin(),
                                     content.begin() + static_cast<ptrdiff_t>(section.begin), '\n');
        const std::string where = "line " + std::to_string(line + 1) + ": ";
        if (section.isDamaged) {
            const std::string header = content.substr(section.begin);
            expected.push_back(
                cut(where + "damaged header: " + header.substr(0, header.find('\n'))));
        } else if (find(sections, section.name) != &section) {
            expected.push_back(cut(where + "section [" + section.name + "] stands more than once"));
        }
    }
    const fuzz::List list = fuzz::newList();
    PLATCSZLIST *faults = list.get();
    REQUIRE(PLATCFileCheckSections(fuzz::kWorking, &faults) == static_cast<int>(expected.size()));
    REQUIRE(fuzz::textsOf(faults) == expected);
}

std::string without(const std::string &content, const std::string &name) {
    std::string rest;
    size_t at = 0;
    for (const Section &section : parse(content)) {
        if (!section.isDamaged && section.name == name) {
            rest += content.substr(at, section.begin - at);
            at = section.end;
        }
    }
    return rest + content.substr(at);
}

// One section is written and removed again: all that is not of it stays byte by byte.
void requireChange(const std::string &content) {
    const char *const name = "5";
    const Pairs pairs = {{"name", " [x]=\t"}, {"cmd", ""}};
    const fuzz::Hash hash = fuzz::hashOf(pairs);
    const PLATCSZHASH *const forms[] = {hash.get()};
    REQUIRE(PLATCFileEditSections(fuzz::kWorking, 1, &name, forms) == 0);
    const std::string changed = fuzz::contentOf(fuzz::kWorking);
    std::string expected = without(content, name);
    std::string rest = without(changed, name);
    if (rest.size() == expected.size() + 1 && rest.back() == '\n') {
        expected += '\n'; // the new section begins a line
    }
    REQUIRE(rest == expected);
    const auto sections = parse(changed);
    REQUIRE(find(sections, name) && find(sections, name)->pairs == pairs);
    requireSection(sections, name);
    REQUIRE(PLATCFileRemoveSection(fuzz::kWorking, name) == 1);
    REQUIRE(fuzz::contentOf(fuzz::kWorking) == rest);
}

} // namespace

void fuzz::test(Input input) {
    shortenReads(input.step());
    const std::string content = input.rest();
    const auto sections = parse(content);
    fuzz::contentOf(fuzz::kWorking) = content;
    for (const char *const name : {"1", "2"}) { // nothing is remembered yet
        requireSection(sections, name);
    }
    const fuzz::List list = fuzz::newList();
    PLATCSZLIST *names = list.get();
    REQUIRE(PLATCFileEnumSection(fuzz::kWorking, &names) >= 0);
    std::vector<std::string> expected = namesOf(sections);
    std::transform(expected.begin(), expected.end(), expected.begin(), cut);
    REQUIRE(fuzz::textsOf(names) == expected);
    constexpr size_t kMost = 8; // each reads the file
    for (size_t i = 0; i < std::min(kMost, expected.size()); ++i) {
        requireSection(sections, expected[i]);
    }
    switch (content.size() % 3) {
    case 0:
        requireTasks(sections);
        break;
    case 1:
        requireChange(content);
        break;
    default:
        requireFaults(content, sections);
    }
}
