// The portable platform where the library's own tests do not reach.
#include "support.h"

#include <csignal>
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

using namespace support;
using Platform = SchedTest;

std::string sectionOf(const char *path, const char *name) {
    PLATCSZHASH *hash = PLATCSzHashAlloc(8);
    const int found = PLATCFileGetSection(path, name, &hash);
    const char *const value = PLATCSzHashGetValue(hash, "k");
    const std::string result = std::to_string(found) + ":" + (value ? value : "");
    PLATCSzHashFree(hash);
    return result;
}

// A rewrite of the same length in the same tick of the file clock must show at once.
TEST_F(Platform, SectionFilesAreNeverServedStale) {
    for (int i = 0; i < 2000; ++i) {
        const std::string value = std::to_string(1000 + i);
        const int fd = open("/tmp/f", O_WRONLY | O_CREAT, 0600);
        const std::string content = "[a]\nk=" + value + "\n[b]\nk=x\n";
        ASSERT_EQ(write(fd, content.data(), content.size()), static_cast<ssize_t>(content.size()));
        close(fd);
        ASSERT_EQ(sectionOf("/tmp/f", "a"), "1:" + value);
    }
}

TEST_F(Platform, SectionFilesKeepWhatTheyDoNotChange) {
    const std::string head = "; comment\n[a]\n\njunk\n k = v \nk==[x]\n";
    writeFile("/etc/f", head + "[b]\nk=1\n[a]\nk=second");
    chmod("/etc/f", 0604);
    EXPECT_EQ(sectionOf("/etc/f", "a"), "1:=[x]");
    EXPECT_EQ(sectionOf("/etc/f", "c"), "0:");
    PLATCSZHASH *hash = PLATCSzHashAlloc(8);
    PLATCSzHashSetValue(&hash, "k", " [b] ");
    EXPECT_EQ(PLATCFileSetSection("/etc/f", "c", hash), 0);
    EXPECT_EQ(PLATCFileSetSection("/etc/f", "b", hash), 1);
    EXPECT_EQ(PLATCFileAddSection("/etc/f", "c", hash), 1);
    EXPECT_EQ(readFile("/etc/f"), head + "[b]\nk= [b] \n[a]\nk=second\n[c]\nk= [b] \n");
    EXPECT_EQ(PLATCFileRemoveSection("/etc/f", "b"), 1);
    EXPECT_EQ(PLATCFileRemoveSection("/etc/f", "b"), 0);
    EXPECT_EQ(readFile("/etc/f"), head + "[a]\nk=second\n[c]\nk= [b] \n");
    struct stat status {};
    stat("/etc/f", &status);
    EXPECT_EQ(status.st_mode & 07777, 0604U);
    // What would not come back as it went in is not written.
    for (const auto &[key, value] : std::vector<std::pair<const char *, const char *>>{
             {"a=b", ""}, {"[k", ""}, {"", ""}, {"k\n", ""}, {"k", "1\n2"}}) {
        PLATCHashRemoveAll(hash);
        PLATCSzHashSetValue(&hash, key, value);
        EXPECT_EQ(PLATCFileAddSection("/etc/f", "d", hash), -1);
        EXPECT_EQ(PLATCErrGet(), 0x0D00U);
    }
    PLATCSzHashFree(hash);
    EXPECT_EQ(sectionOf("/etc/none", "a"), "-1:");
    // A hand that left blanks behind a header, or a name twice, merges no tasks and doubles none.
    writeFile("/etc/f", "[1]\nk=1\n[2] \r\nk=2\n[3\nk=3\n[1]\nk=4\n");
    EXPECT_EQ(sectionOf("/etc/f", "1") + sectionOf("/etc/f", "2"), "1:11:2");
    PLATCSZLIST *names = PLATCSzListAlloc(4);
    EXPECT_EQ(PLATCFileEnumSection("/etc/f", &names), 2);
    PLATCSzListFree(names);
    EXPECT_EQ(PLATCFileRemoveSection("/etc/f", "1"), 1);
    EXPECT_EQ(readFile("/etc/f"), "[2] \r\nk=2\n[3\nk=3\n");
}

// Reading all sections is linear also while the file's times lie ahead of the clock.
TEST_F(Platform, SectionFilesOfTheFutureAreRemembered) {
    std::string content;
    for (int i = 0; i < 4000; ++i) {
        content += "[" + std::to_string(i) + "]\nk=" + std::string(2000, 'v') + "\n";
    }
    writeFile("/tmp/f", content);
    shell("touch -d '+1 day' /tmp/f");
    nanosleep(std::array<timespec, 1>{{{0, 20000000}}}.data(), nullptr);
    const clock_t start = clock();
    for (int i = 0; i < 4000; ++i) {
        ASSERT_EQ(sectionOf("/tmp/f", std::to_string(i).c_str()).size(), 2002U);
    }
    EXPECT_LT(clock() - start, 2 * CLOCKS_PER_SEC);
}

TEST_F(Platform, LinesAreReplacedOneByOne) {
    writeFile("/etc/f", "a 1\nb 1\na 2");
    chmod("/etc/f", 0600);
    EXPECT_EQ(PLATCFileSetLine("/etc/f", "a ", nullptr), 1);
    EXPECT_EQ(PLATCFileSetLine("/etc/f", "b", "c"), 1);
    EXPECT_EQ(readFile("/etc/f"), "c\na 2");
    EXPECT_EQ(PLATCFileSetLine("/etc/f", "a ", nullptr), 1);
    EXPECT_EQ(PLATCFileSetLine("/etc/f", "a ", nullptr), 0);
    EXPECT_EQ(readFile("/etc/f"), "c\n");
    EXPECT_EQ(PLATCFileSetLine("/etc/none", "a", nullptr), -1);
}

TEST_F(Platform, ProgramsAndProcesses) {
    for (auto *action : {SIG_DFL, SIG_IGN}) {
        signal(SIGCHLD, action);
        const char *const arguments[] = {"-c", "exit 3", nullptr};
        EXPECT_EQ(PLATCExec("/bin/sh", arguments), 3);
        EXPECT_EQ(PLATCExec("/bin/true", arguments + 2), 0);
        EXPECT_EQ(PLATCExec("/no/such/program", arguments + 2), -1);
        EXPECT_EQ(PLATCErrGet(), 0x2A00U);
    }
    signal(SIGCHLD, SIG_DFL);
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
            _exit(0);
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
