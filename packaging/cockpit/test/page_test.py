"""Every action of the page once, checked by the command line; what it looks like; and who can use it."""
import json
import pathlib
import sys
import time
import unittest

from selenium.webdriver.common.keys import Keys

import machine
from browser import DOWNLOADS, Page

BUILD = pathlib.Path(sys.argv.pop(1))
FOLDER = BUILD / "packaging/cockpit"
AXE = FOLDER / "node_modules/axe-core/axe.min.js"
HOSTILE = "<img src=x onerror=\"document.title='taken'\">"
WEEKDAYS = ["Mon", "Tue", "Wed", "Thu", "Fri"]
SECONDS = 5  # until another's change shows


def setUpModule():
    global page, servers
    servers = machine.start(BUILD)
    page = Page()


def tearDownModule():
    page.driver.quit()
    for server in servers:
        server.terminate()


class PageTest(unittest.TestCase):
    def tearDown(self):
        machine.clear()
        self.assertEqual(page.complaints(), [])

    def check_stored(self, name, **members):
        """Waits for the stored task to have these members."""
        machine.until(lambda: name in machine.tasks(), f"{name} is stored")
        machine.until(lambda: {key: machine.tasks()[name][key] for key in members} == members,
                      f"{name} has {members}, not {machine.tasks()[name]}")

    def test_list(self):
        machine.add("--name", "Nightly backup", "--command", "true", "--app", "backups")
        scan = machine.add("--name", "Scan", "--command", "exit 2", "--owner", "nobody", "--at", "08:00", "--disabled")
        machine.add("--name", HOSTILE, "--command", "true")
        hidden = json.loads(machine.tavisched("export", scan))
        hidden[0].update(name="Hidden", listable=False)
        pathlib.Path("/tmp/hidden.json").write_text(json.dumps(hidden))
        machine.tavisched("import", "/tmp/hidden.json")
        machine.tavisched("run", "--wait", scan)
        page.open("", "Nightly backup")
        self.assertEqual(len(page.all("tbody tr")), 3)
        row = page.row("Scan").text
        for text in "daily 08:00", "never", "nobody", "exit 2", "Disabled":
            self.assertIn(text, row)
        self.assertEqual(page.find("tbody tr:last-child th").text, HOSTILE)
        for title, value, shown in [("Search", "BACK night", "Nightly backup"), ("Show", "Last run failed", "Scan"),
                                    ("Owner", "nobody", "Scan")]:
            with self.subTest(title):
                page.enter(title, value)
                self.assertEqual([cell.text for cell in page.all("tbody th")], [shown])
                page.enter(title, {"Search": Keys.BACKSPACE, "Show": "All tasks", "Owner": "Any owner"}[title])
        self.assertEqual(page.all("img"), [])

    def test_add(self):
        page.open("", "There are no tasks yet")
        page.press("Add task")
        page.enter("Name", HOSTILE)
        page.enter("Command", "echo \"$TAVI_TASK_ID\" --and 'more'")
        page.enter("Owner", "nobody")
        page.enter("When", "On days of the week")
        for day in "Monday", "Friday":
            page.find(f"[aria-label={day}]").click()
        page.enter("Time", "08:30")
        page.enter("Repeat in the day", "Every 4 hours")
        page.enter("Until hour", "20")
        page.until_text("20:30", ".preview")
        self.assertEqual(len(page.all(".preview li")), 5)
        page.press("Save")
        self.check_stored(HOSTILE, command="echo \"$TAVI_TASK_ID\" --and 'more'", owner="nobody", type="weekly",
                          week=["Mon", "Fri"], runHour=8, runMinute=30, repeatHour=4, lastWorkHour=20, state="enabled")
        page.until_text(HOSTILE, "tbody")
        self.assertEqual(page.all("img"), [])

    def test_errors_beside_their_fields(self):
        for fields, wrong, error in [
                ({"Command": "true", "Owner": "nobody-here"}, "Owner", "there is no user"),
                ({"Command": " "}, "Command", "it is empty"),
                ({"Command": "true", "When": "Once", "Date": "2001-02-03"}, None, "has passed"),
                ({"Command": "true", "Time": "21:00", "Repeat in the day": "Every 2 hours", "Until hour": "20"},
                 "Until hour", "is before the first run")]:
            with self.subTest(wrong):
                page.open("", "There are no tasks yet")
                page.press("Add task")
                for title, value in fields.items():
                    page.enter(title, value)
                page.press("Save")
                page.until_text(error, "form .alert.danger, .wrong .error")
                if wrong:
                    self.assertIn(error, page.error_of(wrong))
                    self.assertEqual(page.driver.switch_to.active_element, page.field(wrong))
        self.assertEqual(machine.tasks(), {})

    def test_edit(self):
        task = machine.add("--name", "Report", "--command", "true", "--monthly", "15", "--at", "08:10", "--app", "mail")
        page.open(f"task/{task}", "Report")
        page.press("Edit")
        page.until_text("Edit “Report”")
        self.assertEqual(page.field("Day of the month").get_attribute("value"), "15")
        # What another one changes meanwhile stays, as only what was changed here is stored.
        machine.tavisched("edit", task, "--app", "post", "--command", "false")
        page.enter("Name", "Yearly report")
        page.enter("When", "Every year")
        page.enter("Month", "December")
        page.enter("Day of the month", "24")
        page.press("Save")
        self.check_stored("Yearly report", id=task, type="yearly", startMonth=12, startDay=24, runHour=8, runMinute=10,
                          app="post", command="false")
        page.until_text("Yearly report", "main")

    def test_enable_and_disable(self):
        machine.add("--name", "Scan", "--command", "true")
        page.open("", "Scan")
        for state in "disabled", "enabled":
            page.button("Enabled: Scan").send_keys(Keys.SPACE)
            self.check_stored("Scan", state=state)
            page.until_text(f"“Scan” is {state}.", "#notices")

    def test_run_follow_and_stop(self):
        task = machine.add("--name", "Long", "--command", "echo one; until [ -e /tmp/go ]; do sleep 0.1; done; echo two")
        page.open(f"task/{task}", "It has not run yet")
        page.press("Run now")
        page.until_text("one", ".output pre")
        self.assertEqual([run["result"] for run in machine.runs(task)], ["running"])
        pathlib.Path("/tmp/go").touch()
        page.until_text("one\ntwo", ".output pre")
        page.until_text("ok", "tbody")
        pathlib.Path("/tmp/go").unlink()
        page.press("Run now")
        page.press("Stop")
        page.answer("Cancel")
        self.assertEqual(machine.runs(task)[0]["result"], "running")
        page.press("Stop")
        page.answer("Stop")
        machine.until(lambda: machine.runs(task)[0]["result"] == "stopped by a person", "the run is stopped")
        page.until_text("stopped by a person", "tbody")
        page.open("", "Long")
        page.press("Run now: Long")
        machine.until(lambda: len(machine.runs(task)) == 3, "it runs from the list, too")
        page.press("Stop: Long")
        page.answer("Stop")

    def test_output_of_any_bytes(self):
        task = machine.add("--name", "Bytes", "--command", "printf 'a\\377<b>\\n'")
        machine.tavisched("run", "--wait", task)
        page.open(f"task/{task}", "Output")
        page.press("Output")
        page.until_text("a\ufffd<b>", ".output pre")

    def test_remove(self):
        task = machine.add("--name", HOSTILE, "--command", "true")
        page.open(f"task/{task}", HOSTILE)
        page.press("Remove")
        self.assertIn(HOSTILE, page.text("dialog"))
        page.driver.switch_to.active_element.send_keys(Keys.ESCAPE)
        machine.until(lambda: not page.all("dialog"), "Escape closes the question")
        self.assertEqual(page.driver.switch_to.active_element, page.button("Remove"))
        self.assertIn(HOSTILE, machine.tasks())
        page.press("Remove")
        page.answer("Remove")
        machine.until(lambda: not machine.tasks(), "the task is removed")
        page.until_text("There are no tasks yet")

    def test_permissions(self):
        task = machine.add("--name", "Fixed", "--command", "true")
        form = json.loads(machine.tavisched("export", task))[0]
        everything = {"Run now", "Edit", "Remove", "Enabled: Fixed"}
        for denied, gone in [({}, set()), ({"canRunFromUI": False}, {"Run now"}), ({"canDeleteFromUI": False}, {"Remove"}),
                             ({"canEditFromUI": False}, {"Edit", "Enabled: Fixed"})]:
            with self.subTest(denied):
                pathlib.Path("/tmp/task.json").write_text(json.dumps({**form, **denied}))
                machine.tavisched("import", "--replace", "/tmp/task.json")
                page.open(f"task/{task}", "Coming runs")
                self.assertEqual({name for name in everything if not page.buttons(name)}, gone)
        for flag, title in ("canEditName", "Name"), ("canEditOwner", "Owner"):
            with self.subTest(flag):
                pathlib.Path("/tmp/task.json").write_text(json.dumps({**form, flag: False}))
                machine.tavisched("import", "--replace", "/tmp/task.json")
                page.open(f"task/{task}/edit", "Edit “Fixed”")
                fields = {label.text for label in page.all("label")}
                self.assertEqual({"Name", "Owner"} - fields, {title})

    def test_without_administrative_access(self):
        machine.add("--name", "Scan", "--command", "true")
        page.open("", "with administrative access only", machine.PORT_OF_NOBODY)
        self.assertNotIn("Scan", page.text())

    def test_changes_of_others(self):
        page.open("", "There are no tasks yet")
        task = machine.add("--name", "Another's", "--command", "true")
        page.until_text("Another's", "tbody", SECONDS)
        page.find("[type=search]").send_keys("other")
        machine.tavisched("run", "--wait", task)
        page.until_text("ok", "tbody", SECONDS)
        self.assertEqual(page.driver.switch_to.active_element, page.find("[type=search]"))
        page.enter("Search", Keys.BACKSPACE)
        machine.tavisched("remove", "--yes", task)
        page.until_text("There are no tasks yet", seconds=SECONDS)

    def test_timeline(self):
        task = machine.add("--name", "Every hour", "--command", "exit 1", "--at", "00:15", "--every", "1")
        machine.add("--name", HOSTILE, "--command", "true", "--at", "02:15")
        machine.add("--power", "off", "--daily", "--at", "23:30")
        machine.add("--power", "on", "--daily", "--at", "07:00")
        machine.tavisched("run", "--wait", task)
        page.open("week", "will run")
        calendar = json.loads(machine.tavisched("calendar", "--days", 7, "--json"))
        self.assertEqual(len(page.all(".timeline rect.start")), sum(len(each["starts"]) for each in calendar["tasks"]))
        self.assertEqual(len(page.all(".timeline .run.failed")), 1)
        self.assertEqual(len(page.all(".timeline rect.off")), len(calendar["off"]))
        self.assertEqual(len(page.all(".timeline path.busy")), len(calendar["busy"]))
        self.assertGreater(len(calendar["off"]) * len(calendar["busy"]), 0)
        self.assertEqual(page.all("img"), [])
        page.enter("Days shown", "1 day")
        machine.until(lambda: len(page.all(".timeline rect.start")) < 50, "fewer days are shown")
        page.find("summary").click()
        self.assertIn("exit 1", page.text("tbody"))

    def test_power(self):
        page.open("power", "There are no power schedules")
        page.press("Add power schedule")
        for day in "Monday", "Tuesday", "Wednesday", "Thursday", "Friday":
            page.find(f"[aria-label={day}]").click()
        page.enter("Time", "23:30")
        page.press("Save")
        stored = lambda: [(task["appArgs"], task["week"], task["runHour"], task["runMinute"], task["state"])
                          for task in machine.tasks().values()]
        machine.until(lambda: stored() == [("poweroff", WEEKDAYS, 23, 30, "enabled")], "the schedule is stored")
        page.press("Edit: Power off, Mon-Fri 23:30")
        page.until_text("Edit power schedule")
        page.enter("Time", "22:15")
        page.press("Save")
        machine.until(lambda: stored() == [("poweroff", WEEKDAYS, 22, 15, "enabled")], "the schedule is edited")
        page.press("Enabled: Power off, Mon-Fri 22:15")
        machine.until(lambda: stored() == [("poweroff", WEEKDAYS, 22, 15, "disabled")], "the schedule is disabled")
        page.until_text("never", "tbody")
        self.assertEqual(page.driver.switch_to.active_element, page.button("Enabled: Power off, Mon-Fri 22:15"))
        page.press("Remove: Power off, Mon-Fri 22:15")
        page.answer("Remove")
        machine.until(lambda: stored() == [], "the schedule is removed")
        page.until_text("There are no power schedules")

    def test_check_and_repair(self):
        pathlib.Path("/tmp/tavischedtask").unlink()
        page.open("machine", "/tmp/tavischedtask")
        page.press("Repair")
        page.until_text("Repaired:", "#notices")
        self.assertTrue(pathlib.Path("/tmp/tavischedtask").is_symlink())
        page.until_text("All is well.", "main")

    def test_export_and_import(self):
        task = machine.add("--name", "Räume auf", "--command", "true")
        page.open("", "Räume auf")
        page.press("Export")
        file = pathlib.Path(DOWNLOADS, "tasks.json")
        machine.until(file.exists, "the file is there")
        self.assertEqual(json.loads(file.read_text("utf-8")), json.loads(machine.tavisched("export")))
        machine.tavisched("remove", "--yes", task)
        page.press("Import")
        pathlib.Path("/tmp/wrong.json").write_text('[{"command": "true", "runHour": 99}]')
        page.enter("File", "/tmp/wrong.json")
        page.until_text("runHour", ".alert.danger")
        page.enter("File", str(file))
        page.until_text("Räume auf", "#import-lines")
        self.assertEqual(machine.tasks(), {})
        page.press("Import")
        self.check_stored("Räume auf", id=task, command="true")
        page.until_text("Räume auf", "tbody")

    def test_keyboard(self):
        machine.add("--name", "Scan", "--command", "true")
        page.open("", "Scan")
        reached = []
        for _ in range(30):
            page.driver.switch_to.active_element.send_keys(Keys.TAB)
            active = page.driver.switch_to.active_element
            reached.append(active.get_attribute("aria-label") or active.text or active.get_attribute("type"))
            outline = active.value_of_css_property("outline-style")
            self.assertTrue(outline != "none" or active.get_attribute("role") == "switch", reached[-1])
            if reached[-1] == "Run now: Scan":
                break
        for name in "Tasks", "Timeline", "Add task", "search", "Scan", "Enabled: Scan", "Run now: Scan":
            self.assertIn(name, reached)

    def test_looks_and_accessibility(self):
        looks = Looks(self)
        looks.add_tasks()
        for name, path, text in looks.views():
            with self.subTest(name):
                looks.prepare(name, path, text, 1280)
                looks.check(f"{name}-light")
                page.style("dark")
                looks.check(f"{name}-dark", "color-contrast")
                page.style("light")
                looks.prepare(name, path, text, 390)
                looks.check(f"{name}-narrow")
        looks.picture_for_readme()
        if not AXE.exists():
            print("[  SKIPPED ] Cockpit.Accessibility (axe-core cannot be had)")


class Looks:
    """Pictures of every view, and what an accessibility check says to it."""

    def __init__(self, test):
        self.test = test

    def add_tasks(self):
        self.backup = machine.add("--name", "Nightly backup", "--command", "echo '412 files, 3.1 GiB'", "--app", "backup",
                                  "--weekly", "Mon-Fri", "--at", "22:00", "--owner", "nobody")
        scan = machine.add("--name", "Disk scan", "--command", "exit 2", "--at", "08:00", "--every", "4", "--until", "20")
        machine.add("--name", "Copy to the other site", "--command", "sleep 60", "--at", "02:00", "--app", "backup")
        machine.add("--name", "Monthly report", "--command", "true", "--monthly", "31", "--at", "09:00", "--owner", "nobody")
        machine.add("--name", "Old mail " + "is moved away " * 6, "--command", "true", "--at", "20:00", "--disabled")
        machine.add("--power", "off", "--daily", "--at", "23:30")
        machine.add("--power", "on", "--daily", "--at", "07:00")
        machine.tavisched("run", "--wait", self.backup, scan)
        machine.tavisched("run", 3)

    def views(self):
        return [("list", "", "Nightly backup"), ("timeline", "week", "The same as a table"),
                ("task", f"task/{self.backup}", "History"), ("add", "add", "Add a task"), ("power", "power", "Power off"),
                ("edit-power", "power/add", "What happens"), ("machine", "machine", "remarkable"), ("import", "import", "File")]

    @staticmethod
    def prepare(name, path, text, width):
        page.size(width, 844 if width < 600 else 800)
        page.open(path, text)
        machine.until(lambda: not page.all(".spinner"), "it is loaded")
        if name == "task":
            page.press("Output")
            page.until_text("412 files", ".output pre")
            page.find("summary").click()
        if name == "add":
            page.press("Save")
            page.until_text("it is empty", ".wrong .error")
        page.driver.execute_script("scrollTo(0, 0)")

    def check(self, name, rule=None):
        time.sleep(0.2)  # the switches have moved
        self.save(f"{name}.png")
        sizes = page.driver.execute_script("return [document.documentElement.scrollWidth, innerWidth]")
        self.test.assertLessEqual(sizes[0], sizes[1], "it is wider than the screen")
        if AXE.exists():
            self.test.assertEqual(self.faults(rule), [])

    def save(self, name):
        page.driver.save_screenshot(str(FOLDER / "pictures" / name))

    def picture_for_readme(self):
        page.size(1040, 720, scale=0.8)
        page.open("", "Nightly backup")
        page.enter("Show", "Enabled")
        page.driver.execute_script("document.activeElement.blur()")
        self.save("page.png")
        page.size(1280, 900)

    @staticmethod
    def faults(rule):
        """What is serious or worse, by one rule or by all of them."""
        if not page.driver.execute_script("return Boolean(window.axe)"):
            page.driver.execute_script(AXE.read_text("utf-8"))
        found = page.driver.execute_async_script("axe.run(arguments[0] ? { runOnly: [arguments[0]] } : {}).then(arguments[1])",
                                                 rule)["violations"]
        return [(each["id"], each["help"], [node["html"] for node in each["nodes"]])
                for each in found if each["impact"] in ("serious", "critical")]


if __name__ == "__main__":
    unittest.main(verbosity=2)
