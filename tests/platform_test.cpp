// The portable platform where the library's own tests do not reach.
#include "machine.h"
#include "platplugin.h"
#include "tavisdk.h"

#include <algorithm>
#include <fcntl.h>

namespace {

using namespace support;
using testing::MatchesRegex;
using testing::StartsWith;
using Platform = SchedTest;

std::string sectionOf(const char *path, const std::string &name) {
    PLATCSZHASH *hash = PLATCSzHashAlloc(8);
    const int found = PLATCFileGetSection(path, name.c_str(), &hash);
    const char *const value = PLATCSzHashGetValue(hash, "k");
    const std::string result = std::to_string(found) + ":" + (value ? value : "");
    PLATCSzHashFree(hash);
    return result;
}

// A process that has ended and was not waited for: it writes no more.
pid_t startZombie() {
    const pid_t child = start([] { return 0; });
    siginfo_t info{};
    waitid(P_PID, static_cast<id_t>(child), &info, WEXITED | WNOWAIT);
    return child;
}

TEST_F(Platform, SectionFilesKeepWhatTheyDoNotChange) {
    const std::string head = "; comment\n[a]\n\njunk\n k = v \nk==[x]\n";
    writeFile("/etc/f", head + "[b]\nk=1\n[a]\nk=second");
    chmod("/etc/f", 07604);
    EXPECT_EQ(sectionOf("/etc/f", "a"), "1:=[x]");
    EXPECT_EQ(sectionOf("/etc/f", "c"), "0:");
    EXPECT_EQ(sectionOf("/etc/none", "a"), "-1:");
    PLATCSZHASH *hash = PLATCSzHashAlloc(8);
    PLATCSzHashSetValue(&hash, "k", " [b] ");
    EXPECT_EQ(PLATCFileSetSection("/etc/f", "c", hash), 0);
    EXPECT_EQ(PLATCFileSetSection("/etc/f", "b", hash), 1);
    EXPECT_EQ(PLATCFileAddSection("/etc/f", "c", hash), 1);
    EXPECT_EQ(readFile("/etc/f"), head + "[b]\nk= [b] \n[a]\nk=second\n[c]\nk= [b] \n");
    EXPECT_EQ(PLATCFileRemoveSection("/etc/f", "b"), 1);
    EXPECT_EQ(PLATCFileRemoveSection("/etc/f", "b"), 0);
    EXPECT_EQ(readFile("/etc/f"), head + "[a]\nk=second\n[c]\nk= [b] \n");
    EXPECT_EQ(statusOf("/etc/f").st_mode & 07777, 07604U);
    // What would not come back as it went in is not written.
    const Texts bad = {{"a=b", ""}, {"[k", ""}, {"", ""}, {"k\n", ""}, {"k", "1\n2"}};
    for (const auto &[key, value] : bad) {
        PLATCHashRemoveAll(hash);
        PLATCSzHashSetValue(&hash, key, value);
        EXPECT_EQ(failure(PLATCFileAddSection("/etc/f", "d", hash)), 0x0D00U);
    }
    PLATCSzHashFree(hash);
    // A hand that left blanks behind a header, or a name twice, merges no tasks and doubles none.
    writeFile("/etc/f", "[1]\nk=1\n[2] \r\nk=2\n[3\nk=3\n[1]\nk=4\n");
    EXPECT_EQ(sectionOf("/etc/f", "1") + sectionOf("/etc/f", "2"), "1:11:2");
    PLATCSZLIST *names = PLATCSzListAlloc(4);
    EXPECT_EQ(PLATCFileEnumSection("/etc/f", &names), 2);
    PLATCSzListFree(names);
    EXPECT_EQ(PLATCFileRemoveSection("/etc/f", "1"), 1);
    EXPECT_EQ(readFile("/etc/f"), "[2] \r\nk=2\n[3\nk=3\n");
}

// A request looks through a window over the file.
TEST_F(Platform, SectionsAreFoundWhereverTheyLie) {
    const Texts expected = {{"b", "1:mid"}, {"c", "0:"}, {"d", "1:end"}, {"a", "1:0"}, {"e", "0:"}};
    for (size_t filler = 65536 - 24; filler < 65536 + 8; ++filler) {
        for (const std::string &rest : {std::string(), std::string(200000, 'y')}) {
            writeFile("/etc/f", "[a]\nk=0\nx=" + std::string(filler, '[') + "\n[b] \nk=mid\n" +
                                    rest + "\n[c]x\n[b]\nk=twice\n[d]\nk=end");
            for (const auto &[name, value] : expected) {
                EXPECT_EQ(sectionOf("/etc/f", name), value) << name << " " << filler;
            }
        }
    }
}

// Keys that the section before has, more of them, fewer, in another order or twice.
TEST_F(Platform, APassOverAllSections) {
    writeFile("/etc/f", "k=0\n[1]\na=1\nb=2\n[2] \na=3\nb=4\n[3\n[4]\na=5\n[1]\na=6\n[5]\n"
                        "b=7\na=8\nno pair\n[6]\na=1\nb=2\nc=3\nc=4\n[7]\n" +
                            std::string("[8\0]\na=9\n", 9));
    std::string seen;
    const auto take = [](void *text, const char *name, PLATCSZHASH *pairs) {
        auto &told = *static_cast<std::string *>(text);
        told += std::string(name) + ":";
        for (const char *const key : {"a", "b", "c"}) {
            const char *const value = PLATCSzHashGetValue(pairs, key);
            told += value ? value : "-";
        }
        told += " ";
        return told.ends_with("stop 1:12- 2:34- ") ? 1 : 0;
    };
    EXPECT_EQ(PLATCFileForEachSection("/etc/f", take, &seen), 6);
    EXPECT_EQ(seen, "1:12- 2:34- 4:5-- 5:87- 6:124 7:--- ");
    seen = "stop ";
    EXPECT_EQ(PLATCFileForEachSection("/etc/f", take, &seen), 2);
    EXPECT_EQ(failure(PLATCFileForEachSection("/etc/g", take, &seen)), 0x0900U);
}

TEST_F(Platform, SeveralSectionsChangeInOneWrite) {
    PLATCSZHASH *hash = PLATCSzHashAlloc(1);
    PLATCSzHashSetValue(&hash, "k", "new");
    using Changes = std::vector<std::pair<const char *, const PLATCSZHASH *>>;
    const auto edit = [](const char *path, const Changes &changes) {
        const char *names[4];
        const PLATCSZHASH *hashes[4];
        for (size_t i = 0; i < changes.size(); ++i) {
            std::tie(names[i], hashes[i]) = changes[i];
        }
        return PLATCFileEditSections(path, static_cast<int>(changes.size()), names, hashes);
    };
    const std::string old = "head\n[a]\nk=1\n[b]\nk=2\n[x\nk=3\n[a]\nk=4\n[c]\nk=5";
    const struct {
        Changes changes;
        std::string expected;
    } cases[] = {
        {{}, old},
        {{{"z", hash}, {"b", hash}, {"y", hash}, {"none", nullptr}},
         "head\n[a]\nk=1\n[b]\nk=new\n[x\nk=3\n[a]\nk=4\n[c]\nk=5\n[z]\nk=new\n[y]\nk=new\n"},
        {{{"a", nullptr}, {"c", nullptr}}, "head\n[b]\nk=2\n[x\nk=3\n"},
        {{{"a", hash}, {"c", hash}, {"c", nullptr}}, "head\n[a]\nk=new\n[b]\nk=2\n[x\nk=3\n"},
    };
    for (const auto &[changes, expected] : cases) {
        writeFile("/etc/f", old);
        EXPECT_EQ(edit("/etc/f", changes), 0);
        EXPECT_EQ(readFile("/etc/f"), expected);
    }
    EXPECT_EQ(edit("/etc/new", {{"b", hash}, {"a", hash}, {"c", nullptr}}), 0);
    EXPECT_EQ(readFile("/etc/new"), "[b]\nk=new\n[a]\nk=new\n");
    EXPECT_EQ(statusOf("/etc/new").st_mode & 07777, 0600U);
    // All or nothing.
    EXPECT_EQ(failure(edit("/etc/new", {{"d", hash}, {"e]", hash}})), 0x0D00U);
    EXPECT_EQ(failure(edit("/etc/new", {{"d", hash}, {nullptr, nullptr}})), 0x0D00U);
    EXPECT_EQ(readFile("/etc/new"), "[b]\nk=new\n[a]\nk=new\n");
    symlink("/etc/loop", "/etc/loop"); // not missing, but not to be looked at
    symlink("/etc/none", "/tmp/f");    // somebody's, in a shared folder
    EXPECT_EQ(failure(edit("/etc/loop", {{"d", hash}})), 0x2700U);
    EXPECT_EQ(failure(PLATCFileAddSection("/etc/loop", "d", hash)), 0x2700U);
    EXPECT_EQ(failure(edit("/tmp/f", {{"d", hash}})), 0x0900U);
    EXPECT_TRUE(S_ISLNK(statusOf("/etc/loop").st_mode) && S_ISLNK(statusOf("/tmp/f").st_mode));
    PLATCSzHashFree(hash);
}

// The first line that matches, and a time by which cron sees every change.
TEST_F(Platform, LinesAreSetOneByOne) {
    writeFile("/etc/f", "a x\nb x\nc x");
    const Texts changes = {{"y", "y\nb x\nc x"}, {nullptr, "y\nc x"}, {nullptr, "y\n"}};
    for (const auto &[line, expected] : changes) {
        const time_t before = statusOf("/etc/f").st_mtim.tv_sec;
        EXPECT_EQ(PLATCFileSetLine("/etc/f", "x", line), 1);
        EXPECT_EQ(readFile("/etc/f"), expected);
        EXPECT_GT(statusOf("/etc/f").st_mtim.tv_sec, before);
    }
    EXPECT_EQ(PLATCFileSetLine("/etc/f", "x", nullptr), 0);
}

TEST_F(Platform, WhatAHandSpoiltInASectionFileIsTold) {
    const Texts cases = {
        {"", ""},
        {"junk\n[a] \t\r\nk=[b\n [c\n[]\n[d]", ""},
        {"[a]\n[b\n[\n[a]x\nk=1\n[a]\n\n[a]\n[b]",
         "line 2: damaged header: [b|line 3: damaged header: [|line 4: damaged header: [a]x|"
         "line 6: section [a] stands more than once|line 8: section [a] stands more than once|"},
    };
    PLATCSZLIST *faults = PLATCSzListAlloc(1);
    for (const auto &[text, expected] : cases) {
        writeFile("/etc/f", text);
        std::string told;
        const int count = PLATCFileCheckSections("/etc/f", &faults);
        for (int i = 0; i < count; ++i) {
            told += PLATCSzListGet(faults, i) + std::string("|");
        }
        EXPECT_EQ(told, expected);
        EXPECT_EQ(count, std::count(told.begin(), told.end(), '|'));
    }
    EXPECT_EQ(failure(PLATCFileCheckSections("/etc/none", &faults)), 0x0900U);
    PLATCSzListFree(faults);
}

// What is answered with success outlives a loss of power, but for what a restart empties.
TEST_F(Platform, WritersFlushBeforeAndAfterTheRename) {
    TAVIAUTOPOWER entry{};
    TAVISCHEDULE schedule{};
    schedule.weekBits = 1;
    schedule.szCommand[0] = 'x';
    const auto write = [&](const std::string &path) {
        entry.minute = ++schedule.minute;
        fileCalls();
        return path == "/etc/crontab" ? TAVIScheduleSet(&schedule, 1)
               : path == kPower       ? TAVIAutoPowerConfSet(0, 1, &entry)
                                      : PLATCFileEditSections(path.c_str(), 0, nullptr, nullptr);
    };
    for (const std::string path : {"/etc/crontab", kPower}) {
        EXPECT_EQ(write(path), 0);
        EXPECT_THAT(fileCalls(), ElementsAre(StartsWith("fsync " + path + "."),
                                             MatchesRegex("rename " + path + "\\..* " + path),
                                             "fsync " + path.substr(0, path.rfind('/'))));
        for (bool Fakes::*const fails :
             {&Fakes::fsyncFails, &Fakes::renameFails, &Fakes::folderFsyncFails}) {
            const std::string old = readFile(path);
            fakes.*fails = true;
            EXPECT_EQ(failure(write(path)), fails == &Fakes::renameFails ? 0x2800 : 0x0B00);
            fakes = {};
            EXPECT_EQ(readFile(path) == old, fails != &Fakes::folderFsyncFails);
            EXPECT_EQ(shell("ls " + path + ".* 2> /dev/null"), 2);
        }
    }
    EXPECT_EQ(write("/tmp/f"), 0);
    EXPECT_THAT(fileCalls(), ElementsAre(MatchesRegex("rename /tmp/f\\..* /tmp/f")));
}

TEST_F(Platform, WritersRemoveWhatDeadOnesLeft) {
    PLATPLUGIN *plugin = nullptr;
    EXPECT_EQ(PLATPluginInit("any", "thing", &plugin), 0);
    EXPECT_EQ(failure(PLATPluginAction(6, plugin)), 0x0D00U); // no phase
    EXPECT_EQ(PLATPluginExit(&plugin), 0);
    const pid_t child = startZombie();
    const std::string dead = "." + std::to_string(child);
    const std::string left = dead + ".aB3dEf";
    for (const std::string path : {"/etc/left", "/tmp/left"}) {
        for (const std::string &name :
             {left, dead + ".five5", dead + ".seven77", dead + ".a-b-c-", dead,
              "." + std::to_string(getpid()) + ".mine11", std::string(".1.init11"),
              std::string(".bak.savedd"), "h" + left}) {
            writeFile(path + name, "");
        }
        EXPECT_EQ(PLATCFileEditSections(path.c_str(), 0, nullptr, nullptr), 0);
        EXPECT_EQ(access((path + left).c_str(), F_OK), path == "/etc/left" ? -1 : 0);
        EXPECT_EQ(shell("rm -f " + path + left + "; test $(ls -d " + path + "?* | wc -l) = 8"), 0);
        shell("rm -f " + path + "*");
    }
    waitpid(child, nullptr, 0);
}

TEST_F(Platform, ProgramsAndProcesses) {
    for (auto *action : {SIG_IGN, SIG_DFL}) {
        signal(SIGCHLD, action);
        const char *const arguments[] = {"-c", "exit 3", nullptr};
        EXPECT_EQ(PLATCExec("/bin/sh", arguments), 3);
        EXPECT_EQ(PLATCExec("/bin/true", arguments + 2), 0);
        EXPECT_EQ(failure(PLATCExec("/no/such/program", arguments + 2)), 0x2A00U);
    }
    // Nothing that the caller is sent is eaten.
    writeFile("/tmp/input", "line\n");
    const char *const reads[] = {"-c", "read line && exit 4; exit 5", nullptr};
    const auto readInput = [&] {
        dup2(open("/tmp/input", O_RDONLY), 0);
        return PLATCExec("/bin/sh", reads) + static_cast<int>(lseek(0, 0, SEEK_CUR));
    };
    EXPECT_EQ(inChild(readInput), 5);
    const pid_t child = startZombie();
    EXPECT_EQ(PLATCProcAlive(child), 0);
    waitpid(child, nullptr, 0);
    EXPECT_EQ(PLATCProcAlive(child), 0);
    EXPECT_EQ(PLATCProcAlive(getpid()), 1);
    EXPECT_EQ(PLATCProcAlive(0), 0);
}

} // namespace
