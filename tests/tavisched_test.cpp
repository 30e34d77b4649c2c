// The command line for people, from outside: what it accepts, refuses, stores, shows and repairs.
#include "machine.h"

#include <sys/prctl.h>

namespace {

using namespace support;
using namespace std::string_literals;
using testing::AllOf;
using testing::ContainsRegex;
using testing::MatchesRegex;
using testing::Not;

constexpr const char *kOffFrom4To7 = "[power on]\n000=1 127 7 0\n[power off]\n000=1 127 4 0\n";

class CommandLine : public SchedTest {
  protected:
    // A machine in order: what an installation, a boot and cron leave behind.
    void SetUp() override {
        SchedTest::SetUp();
        if (shell("setpriv --reuid=1 --clear-groups true") != 0) {
            GTEST_SKIP() << "needs several users";
        }
        shell("mkdir -p -m 755 /tmp/lock /usr/tavi/bin; rm -rf /sys/class/rtc/rtc0 2>/dev/null;"
              "chmod 755 /usr/tavi/etc; chmod 644 /etc/crontab; rm -f /etc/crontab2;"
              "cp -u '" TAVISCHED "' '" RUNNER "' /usr/tavi/bin; printf '#!/bin/sh\n' "
              "> /usr/tavi/bin/tavi_poweroff_feasible_check; chmod 755 /usr/tavi/bin/*;"
              "ln -sfn /usr/tavi/bin/tavischedtask /tmp/tavischedtask");
        // This process stands for a cron that is running and takes its signals.
        writeFile("/run/crond.pid", std::to_string(getpid()) + "\n");
        signal(SIGHUP, [](int) {});
        prctl(PR_SET_NAME, "cron");
        setenv("PATH", "/usr/tavi/bin:/usr/sbin:/usr/bin:/sbin:/bin", 1);
        setenv("BOTH", "/tmp/scheduled_tasks /usr/tavi/etc/scheduled_tasks", 1);
        setenv("RUNS", "/var/lib/tavischeduler", 1);
        setenv("HANDLERS", "/usr/tavi/etc/plugins/task_scheduler", 1);
    }

    // Runs "tavisched ARGUMENTS" through the shell; gives what it printed, and sets status_.
    std::string run(const std::string &arguments, const std::string &prefix = "") {
        status_ = shell("{ " + prefix + "tavisched " + arguments + "; } > /tmp/out 2>&1");
        return readFile("/tmp/out");
    }
    // The same, for a command that must end so.
    std::string ended(int status, const std::string &arguments, const std::string &prefix = "") {
        const std::string output = run(arguments, prefix);
        EXPECT_EQ(status_, status) << arguments << "\n" << output;
        return output;
    }
    std::string done(const std::string &arguments) { return ended(0, arguments); }
    std::string failed(const std::string &arguments) { return ended(1, arguments); }
    std::string refused(const std::string &arguments) { return ended(2, arguments); }
    static std::string jsonError(const std::string &option, int status) {
        return "\\{\"error\": \".*\",\"option\": " + option +
               ",\"status\": " + std::to_string(status) + "\\}\n";
    }
    // The state of everything that a refused command must leave alone.
    static std::string machine() {
        std::string all;
        for (const char *const path : {kPersistent, kWorking, kCrontab, kPower}) {
            all += readFile(path) + "|" + std::to_string(statusOf(path).st_mode) + "|";
        }
        return all;
    }

    int status_ = -1;
};

// Each command's example can be typed as it is, one after the other.
TEST_F(CommandLine, ExamplesOfTheHelpWork) {
    shell("echo alice:x:4747:4747::/:/bin/sh >> /etc/passwd");
    for (int i = 0; i < 4; ++i) {
        done("add --command 'echo x'");
    }
    run("run 3 --wait");
    shell(
        "cd /tmp; for c in $(tavisched --help | sed -n '/^Subc/,/^$/s/^  \\([a-z]*\\)  .*/\\1/p'); do"
        " tavisched $c --help | sed -n '/^Example:/{n;p}' > example; [ -s example ] &&"
        " sh example > /dev/null 2>&1 < /dev/null; echo $c $?; done > /tmp/out;"
        "sed -i /^alice:/d /etc/passwd");
    EXPECT_EQ(readFile("/tmp/out"),
              "list 0\nshow 0\nnext 0\ncalendar 0\nhistory 0\nlog 0\nexport 0\nadd 0\nedit 0\n"
              "enable 0\ndisable 0\nremove 0\nimport 0\nrun 0\nstop 2\nsync 0\ncheck 0\n");
    EXPECT_THAT(done("list"), ContainsRegex("3  Task 3 .* ok just now\n4  Task 4 .*\n5  Backup "));
}

TEST_F(CommandLine, RefusesSlipsAndChangesNothing) {
    done("add --command true --at 08:00 --every 4 --until 20");
    done("add --power off --at 23:00 --weekly Mon");
    const struct {
        const char *said;
        std::vector<std::string> arguments; // options alone: of an add
        const char *option = nullptr;       // as JSON tells it
    } cases[] = {
        {"needs --command", {"add"}, "\"command\""},
        {"--command: it is empty", {"add --command ' '"}},
        {"at most 12285", {"add --command \"$(head -c 12286 /dev/zero | tr '\\0' x)\""}},
        {"20000 bytes", {"add --command \"$(head -c 20000 /dev/zero | tr '\\0' x)\""}},
        {"is not accepted; accepted: HH:MM", {"--at 23:60", "--at 9:5", "--at 24:00"}, "\"at\""},
        {"--yearly: ", {"--yearly 02-30", "--yearly 13-01"}},
        {"a day from 1 to 31", {"--monthly 32", "--monthly 0"}},
        {"is no day of the week; accepted: a list",
         {"--weekly ''", "--weekly Mon-", "--weekly Mon,,Fri"},
         "\"weekly\""},
        {"a date of the calendar", {"--once 2099-02-29"}},
        {"2020-01-01 at 00:00, has passed", {"--once 2020-01-01"}, "\"once\""},
        {"--until: it needs an interval", {"--every 0 --until 20"}},
        {"hours from 1 to 23", {"--every 24"}},
        {"an hour from 00 to 23", {"--every 2 --until 24"}},
        {"hour 11 is before the first run", {"--at 12:00 --every 2 --until 11"}},
        {"only one of --daily", {"--daily --monthly 1"}},
        {"only one of --enabled", {"--enabled --disabled"}},
        {"there is no user", {"--owner nosuchuser", "--owner 4000000000"}},
        {"--name: it is empty",
         {"--name '  '", "--name \"$(printf '\\302\\240\\342\\200\\213')\""}},
        {"--name: it holds a line",
         {"--name \"$(printf 'a\\nb')\"", "--name \"$(printf 'a\\342\\200\\250b')\""}},
        {"--name: it is not valid UTF-8", {"--name \"$(printf 'a\\377')\""}},
        {"at most 4095", {"--name \"$(head -c 4096 /dev/zero | tr '\\0' x)\""}},
        {"--app: it holds", {"--app \"$(printf '\\033[2J')\""}},
        {"accepted: on or off", {"add --power of"}},
        {"--command: a power schedule has none", {"add --power on --command x"}},
        {"there is such a schedule already: task 90022300 (",
         {"add --power off --at 23:00 --weekly Mon"}},
        {"nothing is to be changed", {"edit 1"}},
        {"hour 20 is before the first run of the day at hour 21", {"edit 1 --at 21:00"}},
        {"this is no power schedule", {"edit 1 --power on"}},
        {"keeps its kind", {"edit 90022300 --power on"}},
        {"there is no task 9",
         {"edit 9 --at 08:00", "disable 1 9", "remove 1 9 --yes", "run 9"},
         "null"},
        {"--yes removes without a question", {"remove 1"}},
        {"--next: \"24\" is not accepted; accepted: a time such as 30m", {"list --next 24"}},
        {"/nowhere", {"import /nowhere"}, "null"},
        {"--sort: colour not in", {"list --sort colour"}},
        {"task 4 (Task 4) is kept under another number", {"edit 4 --at 08:00", "show 4"}},
        {"\"01x\" is no id; accepted", {"remove 01x --yes"}},
        {"--limit: Value 0 not in range", {"history --limit 0"}},
        {"--since: \"2026-02-30\" is not accepted; accepted: a time",
         {"history --since 2026-02-30"}},
        {"task 1 has no run 7; \"tavisched history 1\" lists its runs", {"log 1 --run 7"}},
        {"\"1x\" is no run", {"log 1 --run 1x"}},
        {"--after: Value -1 not in range", {"stop 1 --after -1"}, "\"after\""},
        {"there is no command \"frobnicate\"\n\"tavisched --help\"", {"frobnicate"}},
        {"\"; did you mean \"list\"?\n\"tavisched --help\"", {"lsit 3", "ilst"}},
        {"did you mean \"calendar\"?", {"caalleendar", "cleendar", "caleddr", "calenddxr"}},
        {"\"--nmae foo --bar\" is not understood; did you mean \"--name\"",
         {"add --nmae foo --bar"}},
        {"did you mean \"--yes\"?\n\"tavisched remove --help\"", {"rm 1 --ye"}, "null"},
        {"no command \"a\\u009b\\u007f\"", {"\"$(printf 'a\\302\\233\\177')\""}},
        {"a command is needed", {""}},
        {"\"frob it\" is not expected", {"sync frob it"}},
    };
    shell("echo \"$(sed 's/^.1]/[3]/; s/^id=1/id=4/; s/Task 1/Task 4/' /tmp/scheduled_tasks)\" "
          "| tee -a $BOTH > /tmp/out");
    const std::string before = machine();
    for (const auto &[said, all, option] : cases) {
        for (const std::string &one : all) {
            const std::string arguments = (one.starts_with("--") ? "add --command x " : "") + one;
            EXPECT_THAT(refused(arguments), HasSubstr(said)) << arguments;
            EXPECT_EQ(machine(), before) << arguments;
            if (option) {
                EXPECT_THAT(refused(arguments + " --json"), MatchesRegex(jsonError(option, 2)));
            }
        }
    }
}

TEST_F(CommandLine, SchedulesInWordsAndInTheCrontab) {
    const struct {
        const char *options, *words, *fields;
    } cases[] = {
        {"", "daily 00:00", "0\t0\t*\t*\t*"},
        {"--weekly Mon-Fri", "Mon-Fri 00:00", "0\t0\t*\t*\t1,2,3,4,5"},
        {"--weekly monday,Thurs", "Mon, Thu 00:00", "0\t0\t*\t*\t1,4"},
        {"--weekly weekend", "Sun, Sat 00:00", "0\t0\t*\t*\t0,6"},
        {"--weekly fri-mon", "Sun, Mon, Fri, Sat 00:00", "0\t0\t*\t*\t0,1,5,6"},
        {"--weekly weekdays,sat", "Mon-Sat 00:00", "0\t0\t*\t*\t1,2,3,4,5,6"},
        {"--weekly daily", "daily 00:00", "0\t0\t*\t*\t*"},
        {"--weekly 'fri , MON' --at 22:00", "Mon, Fri 22:00", "0\t22\t*\t*\t1,5"},
        {"--weekly Sun,Mon,Tue,Thu --at 7:05", "Sun-Tue, Thu 07:05", "5\t7\t*\t*\t0,1,2,4"},
        {"--daily --at 08:00 --every 4 --until 20", "daily 08:00 every 4 h until 20:00",
         "0\t8,12,16,20\t*\t*\t*"},
        {"--at 21:30 --every 1", "daily 21:30 every 1 h until 23:30", "30\t21,22,23\t*\t*\t*"},
        {"--monthly 15 --at 08:10", "monthly on day 15 at 08:10", "10\t8\t15\t*\t*"},
        {"--yearly 02-29 --at 00:01", "yearly on 02-29 at 00:01", "1\t0\t29\t2\t*"},
        {"--once 2099-12-24 --at 18:00", "once on 2099-12-24 at 18:00", "0\t18\t24\t12\t*"},
    };
    int id = 0;
    for (const auto &c : cases) {
        const std::string number = std::to_string(++id) + "\n";
        const std::string words = c.words;
        const std::string line = c.fields + ("\troot\t/tmp/tavischedtask --run id=" + number);
        const std::string add = std::string("add --command x ") + c.options;
        EXPECT_THAT(done(add + " --dry-run"),
                    HasSubstr("Schedule: " + words + "\nCrontab line: " + line + "Next runs: "));
        EXPECT_EQ(done(add + " --dry-run -q"), number);
        EXPECT_EQ(done(add + " --quiet"), number);
        EXPECT_THAT(readFile(kCrontab), HasSubstr(line));
        EXPECT_THAT(done("list"), HasSubstr("enabled  " + words + "  "));
    }
    EXPECT_THAT(done("check"), HasSubstr("All is well."));
    EXPECT_THAT(done("add --command x"), HasSubstr("Note: no schedule was given, so it is daily"));
    EXPECT_THAT(done("add --power off --dry-run --at 23:00"),
                HasSubstr("Schedule: daily 23:00\nWhat happens: cron runs the power-off check"));
}

TEST_F(CommandLine, EditsKeepWhatIsLeftOut) {
    EXPECT_EQ(done("add --name Größe --command 'echo a\nb' --weekly Mon --at 22:00 --owner bin "
                   "--app a.b --disabled --allow-overlap"),
              "task 1 (Größe): Mon 22:00, disabled\n");
    EXPECT_THAT(done("edit 1 --at 23:15 --enabled --owner 1"),
                HasSubstr("task 1 (Größe): Mon 23:15, next run 2"));
    EXPECT_THAT(done("show 1"), HasSubstr("Overlap        may start while an earlier run goes on"));
    done("edit 1 --no-overlap --monthly 3 --every 2");
    EXPECT_EQ(done("show 1 | sed '/^First day/s/ 20.*/ x/; s/ 20..-..-03 / x /'"),
              "Task 1: Größe\nKind           task (tavischedule)\nState          enabled\n"
              "Schedule       monthly on day 3 at 23:15 every 2 h until 23:15\n"
              "Next run       x 23:15\nLast run       none on record\n"
              "Owner          daemon (1)\nCommand        echo a\n               b\n"
              "Action         -\nApplication    a.b\n  name         -\n  arguments    -\n"
              "Overlap        waits while an earlier run goes on, may start while another task of "
              "its application runs\n"
              "Web            may be listed, edited, renamed, given another owner, run, deleted\n"
              "  dialog       TAVI.VEX.TaskScheduler.EditDialog\n  form         -\n"
              "First day      x\n"
              "Crontab        15\t23\t3\t*\t*\troot\t/tmp/tavischedtask --run id=1\n"
              "Note           it runs once a day, at 23:15, as 2 hours later is after hour 23\n");
    done("export 1 | sed 's/true/no/; s/false/true/; s/no,/false,/; s/enabl/disabl/' > /tmp/one");
    done("import --replace /tmp/one");
    EXPECT_EQ(done("show 1 | grep -E '^(Next|Overlap|Web|  form|Crontab)'"),
              "Next run       never while disabled\n"
              "Overlap        may start while an earlier run goes on, waits while another task of "
              "its application runs\n"
              "Web            may not be touched\n  form         - (simple)\n"
              "Crontab        no line while disabled\n");
    // A first day that lies ahead would keep a task of every day from running.
    done("add --command x --once 2099-01-01");
    done("edit 2 --daily");
    EXPECT_THAT(readFile(kWorking), Not(HasSubstr("2099")));
}

// A power schedule's id follows from what it says; one that cannot be armed is not kept.
TEST_F(CommandLine, PowerSchedulesAreEditedAndRefused) {
    done("add --command x");
    done("add --power off --at 23:00 --weekly Mon");
    done("run 90022300 --wait");
    EXPECT_THAT(done("edit 90022300 --at 23:30"),
                HasSubstr("task 90022330 (PowerOff task 0), was 90022300: Mon 23:30, next run 2"));
    EXPECT_THAT(run("history 90022300"), HasSubstr("there is no task")); // nor are there its runs
    EXPECT_THAT(done("disable 90022330"), HasSubstr("task 80022330 (PowerOff task 0), was 9002"));
    EXPECT_THAT(done("remove 80022330 --yes"), HasSubstr("removed"));
    const std::string before = machine();
    for (const char *const add : {"add --power on --at 06:00", "add --power on --dry-run"}) {
        EXPECT_THAT(failed(add), HasSubstr("machine has no clock that can switch it on: /sys"));
        EXPECT_EQ(machine(), before);
        EXPECT_THAT(failed(add + " --json"s), MatchesRegex(jsonError("null", 1)));
    }
    EXPECT_THAT(done("check"), HasSubstr("note: this machine has no clock that can wake it (/sys"));
    EXPECT_EQ(done("add --power on --disabled -q"), "61270000\n");
    // More of a kind than the library reads.
    shell("awk 'BEGIN { print \"[power off]\"; for (i = 0; i < 100; i++) "
          "printf \"%03d=1 1 %d %d\\n\", i, i / 60, i % 60 }' > /usr/tavi/etc/auto_power");
    EXPECT_THAT(run("add --power off --at 05:00"), HasSubstr("100 power schedules of this kind"));
    // Beside a damaged entry the library would store and then fail.
    const std::string damaged = "[power off]\n000=1 9 99 99\n";
    writeFile(kPower, damaged);
    for (const char *const change :
         {"add --power off", "add --power off --dry-run", "sync", "export"}) {
        EXPECT_THAT(failed(change), HasSubstr("power schedules")) << change;
    }
    done("edit 1 --at 01:00");
    done("export 1 | tavisched import -");
    EXPECT_EQ(readFile(kPower), damaged);
}

TEST_F(CommandLine, NeverMakesALineThatCronRejects) {
    done("add --command x --disabled");
    done("add --command x");
    shell("sed -i '0,/run hour=0/s//run hour=99/' $BOTH");
    EXPECT_THAT(refused("enable 1"), HasSubstr("for the line of task 1 (Task 1): the hour \"99\""));
    // Enabled by hand in both files, so that the next rewrite would make the line.
    shell("sed -i '0,/state=disabled/s//state=enabled/' $BOTH");
    for (const char *const change : {"add --command y", "add --command y --dry-run", "sync",
                                     "edit 2 --at 1:00", "remove 2 --yes"}) {
        EXPECT_THAT(refused(change), HasSubstr("first \"tavisched disable 1\"")) << change;
        EXPECT_THAT(readFile(kCrontab), Not(HasSubstr("id=1\n")));
    }
    done("edit 1 --at 9:00 --dry-run");
    EXPECT_THAT(run("check --repair"), HasSubstr("for the line of task 1"));
    EXPECT_THAT(readFile(kCrontab), Not(HasSubstr("id=1\n")));
    // Not even while several tasks are changed, as a plug-in handler sees.
    addHandler("see", "cat /etc/crontab >> /tmp/seen");
    done("disable 2 1");
    refused("enable 2 1");
    EXPECT_THAT(readFile("/tmp/seen"), AllOf(HasSubstr("SHELL"), Not(HasSubstr("99"))));
    done("edit 1 --at 9:00 --enabled");
    EXPECT_THAT(readFile(kCrontab),
                HasSubstr("\n0\t9\t*\t*\t*\troot\t/tmp/tavischedtask --run id=1"));
}

// What was shown must still be true when the answer comes.
TEST_F(CommandLine, AsksBeforeItRemoves) {
    const struct {
        const char *meanwhile, *answer, *said;
    } cases[] = {
        {"true", "", "Nothing was removed."},
        {"true", "n", "Nothing was removed."},
        {"tavisched edit 1 --at 05:00", "y", "it has changed meanwhile: task 1 (Task "},
        {"true", "y", "task 1 (Task 1): removed"},
    };
    done("add --command x");
    for (const auto &c : cases) {
        ASSERT_THAT(listedIds(), ElementsAre(1));
        shell("cd /tmp; rm -f said; { timeout 60 sh -c 'until grep -qs y/N said; do sleep 0.01; "
              "done'; " +
              std::string(c.meanwhile) + " >&2; echo " + c.answer +
              "; } | script -qfec 'tavisched remove 1' said > /dev/null 2>&1");
        EXPECT_THAT(readFile("/tmp/said"), HasSubstr(c.said));
    }
    EXPECT_THAT(listedIds(), IsEmpty());
}

TEST_F(CommandLine, ShowsTasksForScripts) {
    done("add --name b --command 'echo \"1\"' --weekly Mon --at 05:00 --owner bin --disabled");
    done("add --name A --command x --once 2099-12-24");
    const std::string json = done("list --json --sort name --reverse");
    EXPECT_THAT(json, AllOf(HasSubstr("\"command\": \"echo \\\"1\\\"\","),
                            HasSubstr("\"lastRun\": null,"), HasSubstr("\"nextRun\": null,")));
    EXPECT_LT(json.find("\"b\""), json.find("\"A\""));
    EXPECT_EQ(done("complete-ids"), "1\tb\n2\tA\n");
    // What the web back end exchanges can be saved as it is.
    EXPECT_EQ(TAVISchedTaskSaveFromJson(done("export --web 2 | sed '1d;$d'").c_str(), 0), 2);
}

// The library's next trigger time is another one.
TEST_F(CommandLine, ShowsWhenTasksWillReallyRun) {
    writeFile(kPower, kOffFrom4To7);
    done("add --name late --command 'exit 3' --once 2098-03-04 --at 05:00 --app a");
    done("add --command x --once 2098-02-28");
    shell("sed -i 's/^start day=28/start day=30/; 0,/^type=once/s//type=daily/' $BOTH");
    EXPECT_THAT(run("list"), AllOf(HasSubstr("daily 05:00  2098-03-04 05:00  "),
                                   HasSubstr("once on 2098-02-30 at 00:00  never  ")));
    EXPECT_THAT(done("show 2"), ContainsRegex("Next run +never\n(.*\n)+Note +it will never"));
    EXPECT_THAT(done("next 1 --until 7d"), HasSubstr("Nothing will run until then."));
    EXPECT_EQ(done("next --until 24h | awk 'NR > 1 { print $4 }' | sort -u | xargs"),
              "71270700 91270400\n");
    EXPECT_THAT(done("next 71270700 -n 1 --json"), HasSubstr("\"power\": \"on\""));
    EXPECT_THAT(done("next 1 -n 1 --json"),
                MatchesRegex("\\{.*\"owner\": \"root\",\"power\": null,\"task\": 1,\"time\": "
                             "\"2098-03-04T05:00:00[+-]..:..\"\\}\n"));
    EXPECT_THAT(run("show 1 --json"),
                ContainsRegex("\"starts\": *\n? *\\[\n.*-04T05.*\n.*\n.*\n.*\n.*-08T05"));
    // What is remarkable is told before and after.
    const char *const off = "Note: its runs fall into hours in which the power schedules have the";
    const char *const meets = "Note: task 1, of the same application, starts in the same minute";
    for (const char *const how : {" --dry-run", ""}) {
        EXPECT_THAT(done(std::string("edit 1 --daily --at 05:00") + how), HasSubstr(off)) << how;
    }
    EXPECT_THAT(done("disable 1; tavisched enable 1"), HasSubstr(off));
    EXPECT_THAT(run("list --json"), HasSubstr("into hours in which the power"));
    EXPECT_THAT(done("add --command x --at 5:00 --app a"), AllOf(HasSubstr(off), HasSubstr(meets)));
    const std::string dry = done("edit 3 --at 05:01 --dry-run --json");
    EXPECT_THAT(dry, AllOf(HasSubstr("\"runMinute\": 1,"), HasSubstr("machine off")));
    EXPECT_THAT(dry, Not(HasSubstr("same")));
    EXPECT_THAT(run("check"), HasSubstr("note: task 3 (Task 3): task 1, of the same application"));
    const char *const note =
        "\"canRepair\": false,\"problem\": false,\"task\": 3,\"what\": \"task 3 (Task 3): its runs";
    EXPECT_THAT(failed("check --json"), AllOf(HasSubstr(note), HasSubstr("\"problem\": true"),
                                              ContainsRegex("\"advice\": \"[a-z]")));
    shell("rm /tmp/tavischedtask");
    EXPECT_THAT(run("check --json"), HasSubstr("\"canRepair\": true,\"problem\": true"));
    EXPECT_THAT(run("check --repair --json"), HasSubstr("{\"repaired\": \""));
}

// Escapes in JSON mean the characters; elsewhere nothing of them reaches a terminal.
TEST_F(CommandLine, EscapesWhatControlsTerminals) {
    const std::string harm = "a\u001b\u009b\u007f\u202e\u200b\u00ad\ufeff\u034f\ufe0f\u00aeb";
    Task task = newTask("echo '\u200b'");
    TAVISchedCTaskSetName(task.get(), harm.c_str());
    TAVISchedCTaskSetApp(task.get(), harm.c_str());
    ASSERT_EQ(TAVISchedTaskCreate(task.get()), 0);
    for (const char *const command :
         {"list", "list --json", "show 1", "show 1 --json", "export", "export --web", "disable 1",
          "complete-ids", "remove 2 --yes", "run 1"}) {
        EXPECT_THAT(run(command), Not(ContainsRegex("\u001b|\u009b|\u007f|\u202e|\u200b|\ufeff")))
            << command;
    }
    EXPECT_THAT(
        done("list"),
        HasSubstr("a\\u001b\\u009b\\u007f\\u202e\\u200b\\u00ad\\ufeff\\u034f\ufe0f\u00aeb"));
    for (const char *const form : {"", " --web"}) {
        done("export" + std::string(form) + " > /tmp/all.json");
        const std::string before = machine();
        done("remove 1 --yes");
        done("import /tmp/all.json");
        EXPECT_EQ(machine(), before);
    }
}

TEST_F(CommandLine, ExportAndImportGiveTheSameTasks) {
    done("add --name 'Пример \"x\"' --command 'echo \"a\"\n# b' --weekly Sat --owner bin");
    done("add --command x --disabled --yearly 12-24 --app '007'");
    done("add --power off --at 23:00 --weekly Mon");
    done("export > /tmp/all.json");
    const std::string before = machine();
    done("remove 1 2 90022300 --yes");
    shell("ln -s /tmp/all.json /tmp/link");
    done("import /tmp/link");
    EXPECT_EQ(machine(), before);
    EXPECT_EQ(done("import - < /tmp/all.json"), "task 3 (Пример \"x\"), was 1\ntask 4 (Task 2), "
                                                "was 2\ntask 90022300 (PowerOff task 0)\n");
    // The same tasks once more are overwritten, and only those of the same name.
    shell("sed 's/x\"/y\"/; s/Task 2/Task 9/' /tmp/all.json > /tmp/changed.json");
    EXPECT_EQ(
        done("import --replace --dry-run /tmp/changed.json"),
        "task 1 (Пример \"x\"): would be overwritten\ntask 2 (Task 9): would be stored under a "
        "new id\ntask 90022300 (PowerOff task 0): is there already\n");
    done("remove 3 4 --yes");
    EXPECT_EQ(readFile(kPersistent) + "|", before.substr(0, before.find('|') + 1));
    EXPECT_THAT(done("import --replace /tmp/changed.json"),
                AllOf(HasSubstr("task 1 (Пример \"x\"): overwritten\ntask 3 (Task 9), was 2\n")));
    EXPECT_EQ(listedIds(), (std::vector<int>{1, 2, 3, 90022300}));
    // No task of the file gets the number of a power schedule, and a text of the web back end,
    // which names no backend, is known as one.
    shell("tavisched export --web 1 2 90022300 | sed 's/\"id\": .*\"1\\\\.*/\"id\": "
          "\"\\\\\"90022301\\\\\"\",/; /backend/d' > /tmp/web.json");
    EXPECT_EQ(done("import /tmp/web.json"),
              "task 4 (Пример \"x\"), was 90022301\ntask 5 (Task 2), was 2\n"
              "task 90022300 (PowerOff task 0)\n");
    // Whoever needs a new id gets none that a later one of the file has.
    done("export > /tmp/five.json");
    done("remove 2 3 --yes");
    EXPECT_THAT(
        done("import /tmp/five.json"),
        HasSubstr("task 6 (Пример \"x\"), was 1\ntask 2 (Task 2)\ntask 3 (Task 9)\ntask 7 "));
    // A section that cannot be read keeps its id.
    shell("sed -i 's/^run hour=0/run hour=x/' $BOTH");
    EXPECT_THAT(done("import /tmp/all.json"), HasSubstr(", was 1\n"));
    EXPECT_THAT(readFile(kWorking), HasSubstr("run hour=x"));
}

// The owner goes by the name; a person writes as little as "add" needs.
TEST_F(CommandLine, ImportsWhatPeopleWrite) {
    const struct {
        const char *json, *said;
        int status;
    } cases[] = {
        {R"({"command": "x"})", "task 1 (Task 1)\n", 0},
        {R"([{"command": "x", "type": "weekly", "week": ["Mon", "Fri"], "runHour": 7}])", "", 0},
        {R"({"command": "x", "owner": "daemon", "ownerId": 77})",
         "; the owner daemon has the number 1 here, not 77\n", 0},
        {R"({"command": "x", "owner": "daemon"})", "task 4 (Task 4)\n", 0},
        {R"({"command": "x", "owner": "alice", "ownerId": 1000})",
         "member \"owner\": there is no user \"alice\", who has the number 1000 where", 2},
        {R"({"name": "x"})", "element 1, member \"command\": it is missing", 2},
        {R"({"command": "x", "runHour": "7"})", "\"runHour\": accepted: a whole number", 2},
        {R"({"command": "x", "runHour": 24})", "\"runHour\": 24; accepted: 0 to 23", 2},
        {R"({"command": "x", "listable": 1})", "\"listable\": accepted: true or false", 2},
        {R"({"command": "x", "week": ["Mo"]})", "\"week\": accepted: days, such as", 2},
        {R"({"command": "x", "state": "on"})", "\"state\": \"on\" would be stored as", 2},
        {R"({"command": "x", "nam": "y"})", "\"nam\": no task has it; accepted: backend, ", 2},
        {R"([1,1,1,1,1,1,1,1,1,1,1,1])", "faults: 12\n  element 1: it is no object\n", 2},
        {R"([1,1,1,1,1,1,1,1,1,1,1,1])", "element 10: it is no object\n  and 2 more\n", 2},
    };
    for (const auto &c : cases) {
        writeFile("/tmp/in.json", c.json);
        EXPECT_THAT(ended(c.status, "import /tmp/in.json"), HasSubstr(c.said)) << c.json;
    }
    EXPECT_THAT(done("list"), HasSubstr("2  Task 2  enabled  Mon, Fri 07:00  "));
    shell("printf '{\"command\": \"%012285d\"}' 0 > /tmp/in.json"); // the longest
    done("import --dry-run /tmp/in.json");
    // A task is not taken for a power schedule.
    writeFile("/tmp/in.json", R"([{"command": "x", "appArgs": "poweroff", "week": "Mon"},
        {"backend": -3, "appArgs": "poweroff", "week": "Mon", "type": "weekly"}])");
    EXPECT_THAT(done("import --dry-run /tmp/in.json"), ContainsRegex("stored under a new id\n$"));
    // What is printed can be edited and goes in again.
    done("show 2 --json | sed 's/\"runHour\": 7/\"runHour\": 8/' > /tmp/two.json");
    done("import --replace /tmp/two.json");
    done("list --json > /tmp/all.json");
    const std::string before = machine();
    done("import --replace /tmp/all.json");
    EXPECT_EQ(machine(), before);
    EXPECT_THAT(done("list"), HasSubstr("Mon, Fri 08:00"));
}

TEST_F(CommandLine, ImportsAllOrNothing) {
    done("add --command x");
    done("add --command y");
    done("export --web > /tmp/all.json");
    const std::string before = machine();
    // A member's text in both tasks, which is a JSON string once more, or something else.
    const auto to = [](const std::string &key, const std::string &text) {
        return "s/\"" + key + "\": .*/\"" + key + "\": \"" + text + "\",/";
    };
    const struct {
        std::string edit;
        const char *said;
    } cases[] = {
        {to("run hour", R"(\\"99\\")"),
         "element 1, member \"run hour\": 99; accepted: 0 to 23\n  element 2, member"},
        {R"(s/"cmd": "..eQ/"cmd": "\\"e/)", "element 2, member \"cmd\": \"e==\" is not the base64"},
        {to("listable", "1"), "accepted: a string whose text is a JSON string"},
        {R"(s/"type"/"typ"/)", "member \"typ\": no task has it"},
        {R"(/"name"/d)", "element 1, member \"name\": it is missing"},
        {to("id", R"(\\"7x\\")"), "\"7x\" would be stored as \"7\""},
        {to("app", R"(\\"a\\\\u0000\\")"), "member \"app\": it holds a NUL"},
        {"$d", "is no JSON"},
    };
    for (const auto &c : cases) {
        shell("sed '" + c.edit + "' /tmp/all.json > /tmp/bad.json");
        EXPECT_THAT(refused("import /tmp/bad.json"), HasSubstr(c.said)) << c.edit;
        EXPECT_EQ(machine(), before) << c.edit;
    }
}

TEST_F(CommandLine, RunsNowAndFollows) {
    done("add --command 'echo ${TZ-none} $(umask) > /tmp/ran'");
    done("add --command 'exit 3'");
    done("add --command 'kill -9 $$'");
    // What it leaves behind is not waited for, nor taken for it.
    done("add --command 'sleep 1000 & tavisched run 5; sleep 1.5' --disabled");
    done("add --command true --disabled");
    done("add --command true");
    EXPECT_EQ(ended(3, "run 1 2 3 4 --wait", "umask 077; TZ=Asia/Tokyo "),
              "task 1 (Task 1): started\ntask 2 (Task 2): started\ntask 3 (Task 3): started\n"
              "task 4 (Task 4): started\ntask 1 (Task 1): ok\ntask 2 (Task 2): exit 3\n"
              "task 3 (Task 3): killed by signal 9\ntask 5 (Task 5): started\n"
              "task 4 (Task 4): ok\n");
    EXPECT_EQ(readFile("/tmp/ran"), "none 0022\n"); // nothing of the caller's
    ended(128 + 9, "run 3 --wait");
    EXPECT_EQ(done("run 1"), "task 1 (Task 1): started\n");
    EXPECT_THAT(done("show 3"), ContainsRegex("RESULT\n6  3  Task 3 .*\n[1-5]  3  Task 3 .* 9\n$"));
    EXPECT_EQ(done("history 6"), "There are no runs of task 6 (Task 6) on record.\n");
    // Of those that were started together any may have begun first.
    const std::string second = std::to_string(runs(ofTask(2)).at(0).run);
    done("remove 2 --yes");
    done("add --command x");
    EXPECT_THAT(run("log 2 --run " + second),
                HasSubstr("run " + second + " is of a removed task, Task 2\n"));
    shell("pkill -x sleep");
}

// Outputs, stopping and waiting, with real commands.
TEST_F(CommandLine, ShowsOutputsAndStops) {
    done("add --command \"printf 'a\\tb\\033[2J\\377'; echo err >&2; head -c 200000 /dev/zero\"");
    done("add --command 'echo up; sleep 1000'");
    done("add --command 'echo three'");
    EXPECT_THAT(done("run 1 --wait"), HasSubstr("started\na\tb\033[2J\377err\n"));
    EXPECT_EQ(done("log 1 2>&1 > /dev/null"), "[... 68940 bytes cut out ...]\n");
    EXPECT_EQ(done("log 1 2> /dev/null | wc -c"), "131072\n");
    shell("script -qec 'tavisched log 1' /dev/null < /dev/null | head -c 30 > /tmp/out");
    EXPECT_THAT(readFile("/tmp/out"), HasSubstr("a\tb\\u001b[2J\uFFFDerr\r\n"));
    // Interrupted, it leaves the run alone.
    shell("env --default-signal=INT tavisched run 2 --wait > /tmp/wait 2>&1 & timeout 60 sh -c "
          "'until grep -q up /tmp/wait; do sleep 0.01; done'; kill -INT $!; wait $!; "
          "echo $? >> /tmp/wait");
    EXPECT_THAT(readFile("/tmp/wait"), HasSubstr("goes on (\"tavisched stop\" ends it)\n130\n"));
    EXPECT_THAT(done("run 2"), HasSubstr("(Task 2): waiting for task 2 since 2"));
    EXPECT_TRUE(waitFor("tavisched list | grep '^ *2 .*waiting for task 2 since'"));
    shell("(tavisched log 2 --run 2 --follow > /tmp/followed; touch /tmp/over) &");
    EXPECT_THAT(done("stop 2 --after 1"), HasSubstr("(Task 2), run 2: asked to end; what"));
    EXPECT_TRUE(waitFor("[ -e /tmp/over ]"));
    EXPECT_EQ(readFile("/tmp/followed"), "up\n");
    EXPECT_TRUE(waitFor("[ $(tavisched history 2 | grep -c 'stopped by a') = 2 ]"));
    EXPECT_THAT(refused("stop 2"), HasSubstr("task 2 (Task 2) is not running"));
    EXPECT_THAT(failed("log 3"), HasSubstr("that printed anything"));
    shell("rm $RUNS/*/*");
    EXPECT_THAT(failed("log 2 --run 2"), HasSubstr("the output of run 2 is no longer kept"));
    ended(0, "run 2", "prlimit --sigpending=0 ");
    EXPECT_THAT(failed("stop 2"), HasSubstr("could not be stopped: "));
    shell("pkill -f 'sleep 1000'");
}

TEST_F(CommandLine, MakesUpForMissedTimes) {
    for (const char *const command : {"echo made up", "true", "echo disabled", "exit 1"}) {
        done(std::string("add --at 00:00 --command '") + command + "'");
    }
    EXPECT_EQ(done("run --missed"), "No task has missed its last time.\n");
    shell("touch -d '2 days ago' $RUNS/last_look");
    done("remove 4 --yes"); // looks for them, as every change does
    EXPECT_THAT(done("list"), ContainsRegex("1  Task 1 .*  missed "));
    run("run 2 --wait");
    done("disable 3");
    EXPECT_EQ(done("run --missed --wait"),
              "task 1 (Task 1): started\nmade up\ntask 1 (Task 1): ok\n");
    EXPECT_THAT(done("history"), ContainsRegex("4  Task 4 .removed.  2.* missed\n"));
    shell("touch -d '2 days ago' $RUNS/last_look");
    recorded("DELETE FROM runs WHERE task_id=2");
    EXPECT_EQ(done("run --missed"), "task 2 (Task 2): started\n"); // found by this very command
    EXPECT_EQ(done("run --missed"), "No task has missed its last time.\n");
}

TEST_F(CommandLine, DoesWithoutRecords) {
    done("add --command 'exit 3'");
    shell("rm -rf $RUNS/*; mkdir $RUNS/runs.sqlite");
    EXPECT_THAT(ended(3, "run 1 --wait"), HasSubstr("(Task 1): exit 3, and not recorded; "));
    EXPECT_THAT(run("list"), ContainsRegex("records of runs cannot be read.*Task 1"));
    EXPECT_THAT(run("check"), HasSubstr("runs.sqlite is no file"));
    for (const char *const command : {"history", "log 1", "stop 1", "run --missed"}) {
        EXPECT_THAT(failed(command), HasSubstr("; see \"tavisched check\"")) << command;
    }
}

// Whole outputs, in the night before clocks go forward; "^" is an escape. Those with --past are
// without colours, and JSON is without blanks.
TEST_F(CommandLine, ShowsTheSameAtTheSameTime) {
    shell("ln -sf /usr/share/zoneinfo/Europe/Berlin /etc/localtime;"
          "echo ghost:x:4646:4646::/:/bin/sh >> /etc/passwd");
    const std::string fixed = sharedInShell(FAULTS);
    writeFile(kPower, kOffFrom4To7);
    faults().now = at("2024-02-01 12:00");
    for (const char *const task :
         {"Backup --at 22:00 --owner bin --app Web",
          "'Grüße, lang wie ein Satz' --at 00:30 --every 2 --until 16",
          "Once --once 2024-04-02 --at 22:00 --app Web", "Scan --at 04:30 --every 6",
          "Quiet --monthly 9 --disabled --owner ghost", "Past --once 2024-03-01"}) {
        ended(0, "add --command true --name "s + task, fixed);
    }
    shell("sed -i /^ghost:/d /etc/passwd");
    faults().now = at("2024-03-30 21:40");
    run("run 5 --wait", fixed); // makes the database
    recorded(
        "DELETE FROM runs; WITH given(task, age, result, number, lasted, waited, waited_for) "
        "AS (VALUES (1, 88090, 3, 0, 3725, 90, 8), (2, 185, 7, 2, 70, 0, 0), (2, 300, 3, 0, 1, 0, 0),"
        " (2, 99999, 34, 0, 0, 0, 9), (3, -5, 40, 0, 0, 0, 0), (4, 365, 2, 0, 0, 0, 0),"
        " (5, 900000, 3, 0, 0, 0, 0), (6, 180000, 6, 9, 0, 0, 0), (3, 200000, 37, 0, 0, 0, 0)), "
        "timed AS (SELECT *, 1000 * (" +
        std::to_string(faults().now) +
        " - age) AS asked FROM given) "
        "INSERT INTO runs SELECT NULL, task, 0, task = 1, 0, result, number, 0, asked,"
        " iif(result < 32, asked + 1000 * waited, 0),"
        " iif(result = 2, 0, asked + 1000 * (waited + lasted)),"
        " 1000 * lasted, iif(waited, asked, 0), waited, waited_for, 0, 1, 0, '', 'x'"
        " FROM timed");
    const Texts cases = {
        {"list", R"(
      ^[1mID^[0m  ^[1mNAME^[0m                      ^[1mSTATE^[0m     ^[1mSCHEDULE^[0m                           ^[1mNEXT RUN^[0m          ^[1mOWNER^[0m  ^[1mLAST RUN^[0m
       1  Backup                    enabled   daily 22:00                        2024-03-31 22:00  bin    ^[32mok yesterday^[0m
       2  Grüße, lang wie ein Satz  enabled   daily 00:30 every 2 h until 16:30  2024-03-31 00:30  root   ^[31mfailed: exit 2 3 min ago^[0m
       3  Once                      enabled   once on 2024-04-02 at 22:00        2024-04-02 22:00  root   ^[31mmissed just now^[0m
       4  Scan                      enabled   daily 04:30 every 6 h until 23:30  2024-03-31 04:30  root   ^[31mfailed: interrupted 6 min ago^[0m
       5  Quiet                     ^[2mdisabled^[0m  monthly on day 9 at 00:00          -                 4646   ^[32mok 2024-03-20^[0m
       6  Past                      done      once on 2024-03-01 at 00:00        never             root   ^[31mfailed: killed by signal 9 2 days…^[0m
71270700  PowerOn task 0            enabled   daily 07:00                        2024-03-31 07:00  root   -
91270400  PowerOff task 0           enabled   daily 04:00                        2024-03-31 04:00  root   -
)"},
        {"next 2 4 --number 4", R"(
^[1mSTART^[0m                 ^[1mID^[0m  ^[1mNAME^[0m                      ^[1mOWNER^[0m
Sun 2024-03-31 00:30   2  Grüße, lang wie ein Satz  root
Sun 2024-03-31 04:30   2  Grüße, lang wie ein Satz  root
Sun 2024-03-31 04:30   4  Scan                      root
Sun 2024-03-31 06:30   2  Grüße, lang wie ein Satz  root
)"},
        {"history", R"(
^[1mRUN^[0m  ^[1mTASK^[0m  ^[1mNAME^[0m  ^[1mSTART^[0m                ^[1mEND^[0m                  ^[1mDURATION^[0m    ^[1mWAITED^[0m      ^[1mSTARTED BY^[0m  ^[1mRESULT^[0m
  5     3  x     2024-03-30 22:40:05  2024-03-30 22:40:05  -           -           root        ^[31mmissed^[0m
  2     2  x     2024-03-30 22:36:55  2024-03-30 22:38:05  1 min 10 s  -           root        ^[31mexit 2^[0m
  3     2  x     2024-03-30 22:35:00  2024-03-30 22:35:01  1 s         -           root        ^[32mok^[0m
  6     4  x     2024-03-30 22:33:55  -                    -           -           root        ^[31minterrupted^[0m
  1     1  x     2024-03-29 22:13:20  2024-03-29 23:15:25  1 h 2 min   1 min 30 s  cron        ^[32mok^[0m
  4     2  x     2024-03-29 18:53:21  2024-03-29 18:53:21  -           -           root        ^[31mgiven up, task 9 was running^[0m
  8     6  x     2024-03-28 20:40:00  2024-03-28 20:40:00  0 s         -           root        ^[31mkilled by signal 9^[0m
  9     3  x     2024-03-28 15:06:40  2024-03-28 15:06:40  -           -           root        ^[31mnot started: no such user^[0m
  7     5  x     2024-03-20 12:40:00  2024-03-20 12:40:00  0 s         -           root        ^[32mok^[0m
)"},
        {"history 1 --json",
         R"J({"asked":"2024-03-29T22:11:50+01:00","byCron":true,"due":null,"duration":3725.0,
"end":"2024-03-29T23:15:25+01:00","name":"x","number":0,"outputKept":0,"outputSize":0,
"owner":"root","pid":1,"result":"ok","run":1,"start":"2024-03-29T22:13:20+01:00",
"startedBy":null,"statusCode":3,"task":1,"taskRemoved":false,"waited":90,"waitedFor":8,
"waitingSince":"2024-03-29T22:11:50+01:00"})J"},
        {"calendar --days 2", R"(
                           ^[1mFri 2024-03-29          Sat 2024-03-30          Sun 2024-03-31^[0m
                           ^[2m0  3  6  9  12 15 18 21 0  3  6  9  12 15 18 21 0  3  6  9  12 15 18 21^[0m
^[2mnow^[0m                                                                      v
1 Backup                   ^[2m│^[0m   ^[2m░░░^[0m               ^[32m+^[0m ^[2m│^[0m   ^[2m░░░^[0m                 ^[2m│^[0m   ^[2m░░░^[0m               ^[1mo^[0m
2 Grüße, lang wie ein Satz ^[2m│^[0m   ^[2m░░░^[0m           ^[31mx^[0m     ^[2m│^[0m   ^[2m░░░^[0m               ^[31mx^[0m ^[1mo^[0m   ^[31m!^[0m^[2m░^[0m^[31m!^[0m ^[1mo^[0m ^[1mo^[0m ^[1mo^[0m ^[1mo^[0m ^[1mo^[0m
3 Once                     ^[2m│^[0m   ^[2m░░░^[0m                 ^[2m│^[0m   ^[2m░░░^[0m               ^[31m?^[0m ^[2m│^[0m   ^[2m░░░^[0m
4 Scan                     ^[2m│^[0m   ^[2m░░░^[0m                 ^[2m│^[0m   ^[2m░░░^[0m               ^[31mx^[0m ^[2m│^[0m   ^[31m!^[0m^[2m░░^[0m   ^[1mo^[0m     ^[1mo^[0m     ^[1mo^[0m
5 Quiet                    ^[2m│^[0m   ^[2m░░░^[0m                 ^[2m│^[0m   ^[2m░░░^[0m                 ^[2m│^[0m   ^[2m░░░^[0m
6 Past                     ^[2m│^[0m   ^[2m░░░^[0m                 ^[2m│^[0m   ^[2m░░░^[0m                 ^[2m│^[0m   ^[2m░░░^[0m
71270700 PowerOn task 0    ^[2m│^[0m   ^[2m░░░^[0m                 ^[2m│^[0m   ^[2m░░░^[0m                 ^[2m│^[0m   ^[2m░░░^[0m^[1mo^[0m
91270400 PowerOff task 0   ^[2m│^[0m   ^[2m░░░^[0m                 ^[2m│^[0m   ^[2m░░░^[0m                 ^[2m│^[0m   ^[1mo^[0m^[2m░░^[0m
^[2msame minute^[0m                                                                    *     *     *

A column is 1 h.  o start  + ok  x failed  ? missed  ! start while the machine is off  ░ machine off
Same minute: Sun 2024-03-31 04:30, tasks 2 4
Same minute: Sun 2024-03-31 10:30, tasks 2 4
Same minute: Sun 2024-03-31 16:30, tasks 2 4
)"},
        {"calendar --days 15 --past 0", R"(
                           Sa 30 Su 31 Mo 01 Tu 02 We 03 Th 04 Fr 05 Sa 06 Su 07 Mo 08 Tu 09 We 10 Th 11 Fr 12 Sa 13
                           0  12 0  12 0  12 0  12 0  12 0  12 0  12 0  12 0  12 0  12 0  12 0  12 0  12 0  12 0  12
now                             v
1 Backup                   │░    │░   o│░   o│░   o│░   o│░   o│░   o│░   o│░   o│░   o│░   o│░   o│░   o│░   o│░   o
2 Grüße, lang wie ein Satz │░   xo!22o 2!22o 2!22o 2!22o 2!22o 2!22o 2!22o 2!22o 2!22o 2!22o 2!22o 2!22o 2!22o 2!22o
3 Once                     │░   ?│░    │░    │░   o│░    │░    │░    │░    │░    │░    │░    │░    │░    │░    │░
4 Scan                     │░   x│!o oo│!o oo│!o oo│!o oo│!o oo│!o oo│!o oo│!o oo│!o oo│!o oo│!o oo│!o oo│!o oo│!o oo
5 Quiet                    │░    │░    │░    │░    │░    │░    │░    │░    │░    │░    │░    │░    │░    │░    │░
6 Past                     │░    │░    │░    │░    │░    │░    │░    │░    │░    │░    │░    │░    │░    │░    │░
71270700 PowerOn task 0    │░    │o    │o    │o    │o    │o    │o    │o    │o    │o    │o    │o    │o    │o    │o
91270400 PowerOff task 0   │░    │o    │o    │o    │o    │o    │o    │o    │o    │o    │o    │o    │o    │o    │o
same minute                       ** *  ** *  ** ** ** *  ** *  ** *  ** *  ** *  ** *  ** *  ** *  ** *  ** *  ** *

A column is 4 h.  o start  2 several, # ten or more  x failed  ? missed  ! start while the machine is off  ░ machine off
Same minute: Sun 2024-03-31 04:30, tasks 2 4
Same minute: Sun 2024-03-31 10:30, tasks 2 4
Same minute: Sun 2024-03-31 16:30, tasks 2 4
and 40 more, which --json lists
)"},
        {"calendar --days 2 --past 0 --json",
         R"J({"busy":[{"tasks":[2,4],"time":"2024-03-31T04:30:00+02:00"},{"tasks":[2,4],
"time":"2024-03-31T10:30:00+02:00"},{"tasks":[2,4],"time":"2024-03-31T16:30:00+02:00"}],
"days":["2024-03-30T00:00:00+01:00","2024-03-31T00:00:00+01:00"],
"from":"2024-03-30T00:00:00+01:00","now":"2024-03-30T22:40:00+01:00",
"off":[{"from":"2024-03-30T04:00:00+01:00","until":"2024-03-30T07:00:00+01:00"},
{"from":"2024-03-31T04:00:00+02:00","until":"2024-03-31T07:00:00+02:00"}],"tasks":[{"id":1,
"name":"Backup","owner":"bin","power":null,"runs":[],"schedule":"daily22:00",
"starts":["2024-03-31T22:00:00+02:00"],"state":"enabled"},{"id":2,"name":"Grüße,langwieeinSatz",
"owner":"root","power":null,"runs":[...],"schedule":"daily00:30every2huntil16:30",
"starts":["2024-03-31T00:30:00+01:00","2024-03-31T04:30:00+02:00","2024-03-31T06:30:00+02:00",
"2024-03-31T08:30:00+02:00","2024-03-31T10:30:00+02:00","2024-03-31T12:30:00+02:00",
"2024-03-31T14:30:00+02:00","2024-03-31T16:30:00+02:00"],"state":"enabled"},{"id":3,
"name":"Once","owner":"root","power":null,"runs":[...],"schedule":"onceon2024-04-02at22:00",
"starts":[],"state":"enabled"},{"id":4,"name":"Scan","owner":"root","power":null,"runs":[...],
"schedule":"daily04:30every6huntil23:30","starts":["2024-03-31T04:30:00+02:00",
"2024-03-31T10:30:00+02:00","2024-03-31T16:30:00+02:00","2024-03-31T22:30:00+02:00"],
"state":"enabled"},{"id":5,"name":"Quiet","owner":"4646","power":null,"runs":[],
"schedule":"monthlyonday9at00:00","starts":[],"state":"disabled"},{"id":6,"name":"Past",
"owner":"root","power":null,"runs":[],"schedule":"onceon2024-03-01at00:00","starts":[],
"state":"enabled"},{"id":71270700,"name":"PowerOntask0","owner":"root","power":"on","runs":[],
"schedule":"daily07:00","starts":["2024-03-31T07:00:00+02:00"],"state":"enabled"},
{"id":91270400,"name":"PowerOfftask0","owner":"root","power":"off","runs":[],
"schedule":"daily04:00","starts":["2024-03-31T04:00:00+02:00"],"state":"enabled"}],
"until":"2024-04-01T00:00:00+02:00"})J"},
        {"show 4 | grep Last", R"(
Last run       interrupted, started 2024-03-30 22:33:55 (6 min ago)
)"},
        {"show 3 --json",
         R"J({"action":"","app":"Web","appArgs":"","appName":"","backend":-2,"canDeleteFromUI":true,
"canEditFromUI":true,"canEditName":true,"canEditOwner":true,"canRunAppSameTime":true,
"canRunFromUI":true,"canRunTaskSameTime":false,"command":"true",
"editDialog":"TAVI.VEX.TaskScheduler.EditDialog","editForm":"","id":3,
"lastRun":{"asked":"2024-03-30T22:40:05+01:00","byCron":false,"due":null,"duration":null,
"end":"2024-03-30T22:40:05+01:00","name":"x","number":0,"outputKept":0,"outputSize":0,
"owner":"root","pid":1,"result":"missed","run":5,"start":null,"startedBy":"root",
"statusCode":40,"task":3,"taskRemoved":false,"waited":0,"waitedFor":null,"waitingSince":null},
"lastWorkHour":0,"listable":true,"name":"Once","nextRun":"2024-04-0222:00",
"nextStart":"2024-04-02T22:00:00+02:00","notes":["task1,ofthesameapplication,
startsinthesameminute,firston2024-04-0222:00"],"owner":"root","ownerId":0,"repeatHour":0,
"runHour":22,"runMinute":0,"schedule":"onceon2024-04-02at22:00","simpleEditForm":false,
"startDay":2,"startMonth":4,"startYear":2024,"starts":["2024-04-02T22:00:00+02:00"],
"state":"enabled","type":"once","week":["Sun","Mon","Tue","Wed","Thu","Fri","Sat"]})J"}};
    for (const auto &[command, whole] : cases) {
        const std::string json = strstr(command, "--json")
                                     ? " | tr -d ' \\n' | sed 's/\"runs\":.{[^]]*/\"runs\":[.../g'"
                                     : "";
        shell("script -qec 'stty cols 140; TERM=xterm " + fixed +
              (strstr(command, "--past") ? "NO_COLOR=1 " : "") + "tavisched " + command +
              "' /dev/null | tr -d '\\r' | sed 's/\033/^/g; s/ *$//'" + json + " > /tmp/out");
        std::string expected = whole;
        if (!json.empty()) {
            std::erase(expected, '\n');
        }
        EXPECT_EQ((json.empty() ? "\n" : "") + readFile("/tmp/out"), expected) << command;
    }
    const Texts filters = {{"2", "exit 2|ok|given up, task 9 was running|"},
                           {"2 --since 24h", "exit 2|ok|"},
                           {"1 --since 2020-01-01", "ok|"},
                           {"--failed --limit 3", "missed|exit 2|interrupted|"},
                           {"1 --failed", "There are no such runs of task 1 (Backup) on record.|"}};
    for (const auto &[options, results] : filters) {
        const std::string filter = " | sed '/RESULT/d; s/.*  //' | tr '\\n' '|'";
        EXPECT_EQ(ended(0, "history " + (options + filter), fixed), results);
    }
    EXPECT_THAT(ended(1, "log 3", fixed), HasSubstr("no run on record that printed")); // or began
    EXPECT_EQ(ended(0, "disable 6", fixed),
              "task 6 (Past): once on 2024-03-01 at 00:00, disabled\n");
    EXPECT_THAT(ended(2, "enable 6", fixed), HasSubstr("has passed"));
}

TEST_F(CommandLine, FitsTheTerminal) {
    Task task = newTask();
    TAVISchedCTaskSetName(task.get(), "\033[2J日本日本日本日本日本日本 é name");
    ASSERT_EQ(TAVISchedTaskCreate(task.get()), 0);
    Task hidden = newTask();
    TAVISchedCTaskSetListable(hidden.get(), 0);
    ASSERT_EQ(TAVISchedTaskCreate(hidden.get()), 0);
    const auto shown = [](int columns, const std::string &what) {
        shell("script -qec 'stty cols " + std::to_string(columns) + "; TERM=dumb tavisched " +
              what + "' /dev/null | tr -d '\\r' > /tmp/out");
        return readFile("/tmp/out");
    };
    const auto fits = [&](int columns, const std::string &what) {
        shown(columns, what);
        return shell("sed 's/…/./g; s/│/./g' /tmp/out | awk 'length > " + std::to_string(columns) +
                     "' | grep -q .") == 1;
    };
    const std::string whole = done("list");
    EXPECT_THAT(whole, HasSubstr("1  \\u001b[2J日本日本日本日本日本日本 é name  enabled  "));
    EXPECT_THAT(whole + done("next") + done("calendar"), Not(ContainsRegex("\033|Task 2")));
    for (const char *const command : {"list", "next", "calendar"}) {
        EXPECT_THAT(done(std::string(command) + " --all"), HasSubstr("Task 2"));
    }
    EXPECT_THAT(shown(70, "list"), AllOf(Not(HasSubstr("\033")), HasSubstr("ID  NAME        STATE"),
                                         HasSubstr(" 1  \\u001b[2J…  enabled")));
    // With a power schedule and long texts in it, nothing wraps, and what matters most stays.
    TAVISchedTaskRemove(1);
    EXPECT_EQ(done("calendar"), "There are no tasks to show; --all shows all.\n");
    done("add --power off --at 23:00 --weekly weekdays");
    done("add --name 'A name that is rather long, longer than others' --command x --every 3");
    EXPECT_THAT(shown(80, "list"), AllOf(HasSubstr("STATE"), HasSubstr("OWNER")));
    EXPECT_THAT(shown(40, "list"), AllOf(HasSubstr("90622300"), HasSubstr("NEXT RUN")));
    // Each part begins with its first day, and no day is shown in part.
    EXPECT_THAT(shown(40, "calendar --days 35 --past 0"),
                AllOf(ContainsRegex("^ +([0-9]{2} ){9}[0-9]{2}\n"),
                      ContainsRegex("\n +[0-9]{2} [0-9]{2}\n")));
    EXPECT_THAT(shown(80, "calendar --hours"),
                ContainsRegex("\n +0  3 .* 21\n[^x]*\n +0  3 .* 21\n"));
    const std::pair<const char *, int> narrowest[] = {{"list", 40},
                                                      {"calendar --days 30", 30},
                                                      {"calendar --days 1 --past 0", 30},
                                                      {"calendar --hours", 30}};
    for (const auto &[what, narrow] : narrowest) {
        for (const int columns : {narrow, 80, 200}) {
            EXPECT_TRUE(fits(columns, what)) << readFile("/tmp/out");
        }
    }
    EXPECT_THAT(readFile("/tmp/out"), HasSubstr("A column is 1 h."));
}

// What keeps tasks from running is told by every command that has to do with them.
TEST_F(CommandLine, FindsAndRepairsWhatIsWrong) {
    const struct {
        const char *harm, *found;
        bool repaired;
        int problems = 1;
        int listed = -1; // how a list ends, where it is told there too
    } cases[] = {
        {"rm /run/crond.pid", "cron is not running", false, 1, 0},
        {"echo 999999 > /run/crond.pid", "cron is not running", false},
        {"rm /tmp/tavischedtask", "tavischedtask is missing", true},
        {"ln -sf /nowhere /tmp/tavischedtask", "tavischedtask is missing", true, 1, 0},
        {"chown -h bin /tmp/tavischedtask", "belongs to another user", true},
        {"cd ..; mkdir -m 775 g; chgrp bin g; cp bin/tavischedtask g; ln -sf $PWD/g/tavischedtask "
         "/tmp",
         "others than root can replace", true},
        {"cp ../bin/tavischedtask /run; chown bin /run/tavischedtask; ln -sf /run/tavischedtask /tmp",
         "others than root can replace", true},
        {"rm -r /tmp/lock", "/tmp/lock is missing", true},
        {"rm /tmp/tavischedtask; mkdir /tmp/tavischedtask", "is not the program", true},
        {"touch /tmp/scheduled_tasks.tmp.999999", "999999 was left by a change", true},
        {"cd /tmp; touch scheduled_tasks.tmp.999998 scheduled_tasks.tmp.999999",
         "and 1 more were left by a change", true},
        {"mount -n -t tmpfs -o size=4k small $PWD; cp -a /run/etc/scheduled_tasks $PWD",
         "the file system of /usr/tavi/etc has no room left (bytes)", false, 3},
        {"ln -sf /bin/true /tmp/tavischedtask", "is not the program tavischedtask", true},
        {"chown bin /tmp/lock", "/tmp/lock must belong to root", true},
        {"rm -r /tmp/lock; ln -s /etc /tmp/lock", "/tmp/lock must belong to root", true},
        {"chmod 777 /tmp/lock", "/tmp/lock must belong to root", true},
        {"rm /tmp/scheduled_tasks", "from which tasks are read, is missing", true},
        {": > /tmp/scheduled_tasks", "from which tasks are read, is missing", true, 1, 1},
        {"chmod 666 /tmp/scheduled_tasks", "as root runs what it says", true},
        {"mkfifo /tmp/f; mv /tmp/f /tmp/scheduled_tasks", "as root runs what it says", true},
        {"chmod 664 scheduled_tasks", "etc/scheduled_tasks must belong to root", false},
        {"chmod 775 .", "/usr/tavi/etc must belong to root", false},
        {"echo bad > /tmp/sched_status.sqlite", "no task runs without its status database", true},
        {"chmod 664 /etc/crontab", "cron ignores /etc/crontab, which must be", false},
        {"ln /etc/crontab /etc/crontab2", "cron ignores /etc/crontab, which must be", false},
        // The lines are the last trace of a task that one of the files has lost, or both.
        {"truncate -s 0 $BOTH", "that no task asks for", false},
        {"rm scheduled_tasks", "lost when the machine restarts", true},
        {"sed -i s/daily/weekly/ scheduled_tasks", "differ", false},
        {"tavisched add --command x > /run/x; sed -i '1,/^.2]/{/2]/!d}' /tmp/scheduled_tasks",
         "outlives a restart, differ", false, 2, 1},
        {"touch scheduled_tasks.bak", "put aside", false},
        {"sed -i /id=1/d /etc/crontab", "lacks a task's line", true},
        {"echo '# /tmp/tavischedtask' >> /etc/crontab", "that no task asks for", true},
        {"sed -i 's/^0.23/1\\t23/' /etc/crontab", "has other power-off lines", true},
        {"printf x >> /etc/crontab", "has no line feed", false, 2},
        {"sed -i '1i60 * * * * root x' /etc/crontab", "for its line 1: the minute \"60\"", false, 1,
         0},
        {"rm /etc/crontab", "cannot be read", false},
        {"rm /usr/tavi/bin/tavi_poweroff_feasible_check", "missing or no program", false},
        {"sed -i 's/^run hour=.*/run hour=x/' $BOTH", "can be read: \"run hour\": \"x\"", false, 2},
        {"sed -i '/^cmd=/d' $BOTH", "\"cmd\" is missing", false, 2},
        {"sed -i 's/^owner=.*/owner=54321/' $BOTH",
         "task 1 (Task 1): its \"owner\" is wrong: there is no user with the id 54321", false},
        {"sed -i 's/^\\[1]/[5]/' $BOTH", "section [5] of /tmp/scheduled_tasks says that", false},
        {"sed -i 's/^\\[1]/[1/' $BOTH", "line 1: damaged header: [1", false, 2},
        {"echo \"$(cat scheduled_tasks)\" | tee -a $BOTH > /run/x", "[1] stands more than", false},
        {"sed -i 's/^type=daily/type=Daily/' $BOTH", "not read as it is written: \"type\"", false,
         3},
        {"echo '001=1 127 23 0' >> auto_power", "is there more than once", true, 2},
        {"echo '000=bad' >> auto_power", "power schedules cannot be read", false},
        {"install -Dm 775 /bin/true $HANDLERS/a", "task_scheduler/a is skipped: it must", false},
        {"mkdir -p $HANDLERS; echo '#!/bin/sh' > $HANDLERS/b; echo text > $HANDLERS/README",
         "task_scheduler/b is skipped: it is not executable", false},
        {"mkdir -pm 777 $HANDLERS", "all plug-in handlers are skipped", false},
        {"mkdir -pm 777 ${HANDLERS}_run", "task_scheduler_run must", false},
        {"chmod 711 $RUNS", "/var/lib/tavischeduler, where runs", true},
        {"chown bin $RUNS/runs.sqlite", "runs.sqlite, where runs", true},
        {"echo no database > $RUNS/runs.sqlite", "runs.sqlite are damaged", true},
        {"head -c 4096 /dev/zero | dd of=$RUNS/runs.sqlite bs=4096 seek=1 conv=notrunc",
         "runs.sqlite are damaged", true},
        {"printf '\\143' | dd of=$RUNS/runs.sqlite bs=1 seek=63 conv=notrunc", // a later version
         "runs.sqlite cannot be read, and runs are not recorded", false},
        {"printf '[limits]\nruns_per_tasks=9\n' > run_records", "name runs_per_tasks", false},
    };
    for (const auto &c : cases) {
        SetUp();
        done("add --command x");
        done("add --power off --at 23:00");
        run("run 1 --wait");
        recorded("PRAGMA wal_checkpoint(truncate)");
        ASSERT_THAT(done("check"), AllOf(HasSubstr("All is well."), Not(HasSubstr("aside"))));
        shell("rm -rf /run/etc; cp -a /usr/tavi/etc /run");
        shell("cd /usr/tavi/etc; { " + std::string(c.harm) + "; } 2> /dev/null");
        for (const char *const command :
             {"list", "add --command x", "edit 1 --at 1:00", "enable 1", "sync"}) {
            if (c.listed >= 0) {
                const bool succeeds = c.listed == 0 && command != "sync"s;
                const std::string said = ended(succeeds ? 0 : 1, command);
                EXPECT_THAT(said, ContainsRegex(c.found + "[^\n]*; [a-z\"]"s)) << command;
                EXPECT_LE(std::count(said.begin(), said.end(), '\n'), 4) << said;
            }
        }
        failed("check");
        EXPECT_EQ(shell("exit $(grep ^problem: /tmp/out | tee /tmp/problems | wc -l)"), c.problems)
            << c.harm;
        EXPECT_THAT(readFile("/tmp/problems"), HasSubstr(c.found)) << c.harm;
        EXPECT_THAT(readFile("/tmp/out"), ContainsRegex("problem: .*\n  to do: ")) << c.harm;
        const std::string said = ended(c.repaired ? 0 : 1, "check --repair");
        EXPECT_TRUE(!c.repaired || said.find("repaired: ") != std::string::npos) << c.harm;
        // Nothing was lost by it, and cron's file is as good as before.
        EXPECT_THAT(said, Not(HasSubstr("the hour")));
        EXPECT_TRUE(!c.repaired || done("list").find("Task 1") != std::string::npos) << c.harm;
        const bool isKept = c.repaired || c.listed >= 0;
        EXPECT_THAT(readFile(kCrontab), HasSubstr(isKept ? "id=1\n" : "")) << c.harm;
        shell("umount -n /usr/tavi/etc 2>/dev/null");
    }
}

TEST_F(CommandLine, FiltersAndSortsLists) {
    done("add --name Backup --command 'exit 3' --owner bin --app Web.Disk "
         "--monthly $(date -ud '2 weeks ago' +%-d)");
    done("add --name 'GRÖSSE x' --command true --daily --at $(date -ud '2 hours' +%H:%M)");
    done("add --name Old --command x --once 2099-01-01 --disabled");
    run("run 1 2 --wait");
    const std::pair<const char *, std::vector<std::string>> cases[] = {
        {"1 ", {"bin", "disk back", "--failed", "--owner bin"}},
        {"2 ", {"größe", "--next 3h"}},
        {"3 ", {"disabled", "--owner 0 old"}},
        {"1 2 ", {"ENABLED", "--next 53w"}},
        {"1 2 3 ", {"", "--sort next --reverse"}},
        {"2 1 3 ", {"--sort next"}},
        {"", {"able", "backup größe", "--owner bi", "--next 1h"}}};
    for (const auto &[ids, all] : cases) {
        for (const std::string &options : all) {
            const std::string filter = " | awk 'NR > 1 && $1 != \"-\" { printf $1 \" \" }'";
            EXPECT_EQ(done("list " + (options + filter)), ids) << options;
        }
    }
    EXPECT_THAT(done("ls --sort last --reverse"), ContainsRegex("\n[12]  .*\n[12]  .*\n3  Old"));
}

// The handler ends when both have told.
TEST_F(CommandLine, SaysForWhatItWaits) {
    done("add --command x");
    addHandler("slow", "touch /tmp/slow; [ $2 = post ] || timeout 60 sh -c 'until grep -q waiting "
                       "/tmp/first && grep -qs waiting /tmp/second; do sleep 0.05; done'");
    shell("tavisched edit 1 --at 05:00 2> /tmp/first & until [ -e /tmp/slow ]; do sleep 0.01; done;"
          "tavisched add --command y > /tmp/second 2>&1; wait");
    EXPECT_THAT(readFile("/tmp/first"),
                ContainsRegex("waiting for process [0-9]+ \\(/bin/sh "
                              "/usr/tavi/etc/plugins/task_scheduler/slow task_edit pre"));
    EXPECT_THAT(
        readFile("/tmp/second"),
        ContainsRegex("waiting for process [0-9]+ \\(tavisched\\), which changes tasks\ntask 2 "));
    addHandler("slow", "/usr/tavi/bin/tavisched disable 2 >> /tmp/first 2>&1");
    done("edit 1 --at 06:00");
    EXPECT_THAT(readFile("/tmp/first"), HasSubstr("plug-in handler, cannot make another one"));
}

TEST_F(CommandLine, SaysWhatStandsInItsWay) {
    done("add --command x");
    done("add --command x");
    shell("chmod 1640 $BOTH");
    // With a crontab that cannot be written nothing is stored.
    const std::string before = machine();
    shell("cp /etc/crontab /run/crontab; mount -n --bind /run/crontab /etc/crontab");
    for (const char *const change : {"add --command y", "disable 1 2", "remove 1 --yes", "sync"}) {
        EXPECT_THAT(failed(change), ContainsRegex("nothing could be stored: error 0x2800 .*; "
                                                  "everything is as it was before\n$"));
    }
    shell("umount -n /etc/crontab");
    EXPECT_EQ(machine(), before);
    for (const char *const command : {"list", "add --command z", "check", "run 1", "export"}) {
        EXPECT_THAT(ended(1, command, "setpriv --reuid=1 "), HasSubstr("run by root"));
    }
    shell("chmod 666 $BOTH");
    EXPECT_THAT(failed("list"), HasSubstr("the tasks cannot be read: error 0x"));
}

} // namespace
