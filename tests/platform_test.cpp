// The portable platform where the library's own tests do not reach.
#include "support.h"

#include <csignal>

namespace {

using namespace support;
using Platform = SchedTest;

std::string sectionOf(const char *path, const std::string &name) {
    PLATCSZHASH *hash = PLATCSzHashAlloc(8);
    const int found = PLATCFileGetSection(path, name.c_str(), &hash);
    const char *const value = PLATCSzHashGetValue(hash, "k");
    const std::string result = std::to_string(found) + ":" + (value ? value : "");
    PLATCSzHashFree(hash);
    return result;
}

// A rewrite of the same length in the same tick of the file clock must show at once. Kernels that
// refine the times of a file that is looked at do not do so in a ramfs.
TEST_F(Platform, SectionFilesAreNeverServedStale) {
    ASSERT_EQ(shell("mount -n -t ramfs ram /home"), 0);
    for (int i = 1000; i < 3000; ++i) {
        const std::string value = std::to_string(i);
        writeFile("/home/f", "[a]\nk=" + value + "\n[b]\nk=x\n");
        if (i % 500 == 0) {
            shell("sleep 0.02"); // old enough to be remembered
        }
        EXPECT_EQ(sectionOf("/home/f", "a"), "1:" + value);
    }
    shell("umount -n /home");
}

TEST_F(Platform, SectionFilesKeepWhatTheyDoNotChange) {
    const std::string head = "; comment\n[a]\n\njunk\n k = v \nk==[x]\n";
    writeFile("/etc/f", head + "[b]\nk=1\n[a]\nk=second");
    chmod("/etc/f", 0604);
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
    EXPECT_EQ(statusOf("/etc/f").st_mode & 07777, 0604U);
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

TEST_F(Platform, ProgramsAndProcesses) {
    for (auto *action : {SIG_IGN, SIG_DFL}) {
        signal(SIGCHLD, action);
        const char *const arguments[] = {"-c", "exit 3", nullptr};
        EXPECT_EQ(PLATCExec("/bin/sh", arguments), 3);
        EXPECT_EQ(PLATCExec("/bin/true", arguments + 2), 0);
        EXPECT_EQ(failure(PLATCExec("/no/such/program", arguments + 2)), 0x2A00U);
    }
    const pid_t child = fork();
    if (child == 0) {
        _exit(0);
    }
    siginfo_t info{};
    waitid(P_PID, static_cast<id_t>(child), &info, WEXITED | WNOWAIT);
    EXPECT_EQ(PLATCProcAlive(child), 0); // a zombie
    waitpid(child, nullptr, 0);
    EXPECT_EQ(PLATCProcAlive(child), 0);
    EXPECT_EQ(PLATCProcAlive(getpid()), 1);
    EXPECT_EQ(PLATCProcAlive(0), 0);
}

// A caller that captures its output must not hang on the child, nor see its own output twice.
TEST_F(Platform, DetachedChildren) {
    int output[2];
    ASSERT_EQ(pipe(output), 0);
    const pid_t caller = fork();
    if (caller == 0) {
        dup2(output[1], 1);
        close(output[0]);
        close(output[1]);
        printf("once");
        if (PLATCProcForkChildNoWait() == 0) {
            writeFile("/tmp/detached", std::to_string(getpid()) + "\n");
            pause();
        }
        fflush(stdout);
        _exit(0);
    }
    close(output[1]);
    char text[16] = "";
    EXPECT_EQ(read(output[0], text, sizeof text), 4);
    EXPECT_EQ(read(output[0], text, sizeof text), 0);
    close(output[0]);
    waitpid(caller, nullptr, 0);
    while (readFile("/tmp/detached").find('\n') == std::string::npos) {
    }
    const int child = std::stoi(readFile("/tmp/detached"));
    EXPECT_EQ(PLATCProcAlive(child), 1);
    EXPECT_NE(getsid(child), getsid(0));
    EXPECT_EQ(shell("test \"$(readlink /proc/" + std::to_string(child) +
                    "/fd/[012] | sort -u)\" = /dev/null"),
              0);
    kill(child, SIGKILL);
    waitForChildren();
}

} // namespace
