"""The machine of the test: the programs of the build, cron, and Cockpit's web server, in the sandbox."""
import json
import os
import pathlib
import shutil
import socket
import subprocess
import time

SOURCE = pathlib.Path(__file__).resolve().parents[3]
TOOLS = pathlib.Path("/usr/tavi/bin")
PORT = 9090
PORT_OF_NOBODY = 9091


def start(build):
    """Returns the web servers' processes: one for root, and one for a user without any rights."""
    subprocess.run(["ip", "link", "set", "lo", "up"], check=True, env={"PATH": "/usr/sbin:/sbin"})
    for program in "tavisched", "tavischedtask":
        shutil.copy(build / "tools" / program, TOOLS)
    shutil.copy(SOURCE / "packaging/tavi_poweroff_feasible_check", TOOLS)
    # A clock that could wake the machine.
    subprocess.run("mountpoint -q /sys/class/rtc || mount -n -t tmpfs class /sys/class; mkdir -p /sys/class/rtc/rtc0;"
                   "touch /sys/class/rtc/rtc0/wakealarm; /usr/sbin/cron", shell=True, check=True)
    os.environ.update(PATH=f"{TOOLS}:{os.environ['PATH']}", HOME="/home", LC_ALL="C.UTF-8",
                      XDG_DATA_DIRS=f"{build}/packaging/cockpit/share:/usr/share")
    tavisched("check", "--repair")
    return [serve(PORT), serve(PORT_OF_NOBODY, "setpriv", "--reuid=nobody", "--clear-groups")]


def serve(port, *as_user):
    server = subprocess.Popen([*as_user, "/usr/lib/cockpit/cockpit-ws", "--no-tls", "--address=127.0.0.1",
                               f"--port={port}", "--local-session=cockpit-bridge"], stderr=subprocess.DEVNULL)
    until(lambda: answers(port), "the web server answers")
    return server


def answers(port):
    with socket.socket() as connection:
        return connection.connect_ex(("127.0.0.1", port)) == 0


def tavisched(*arguments):
    """What the command line writes; it may fail."""
    return subprocess.run(["tavisched", *map(str, arguments)], stdout=subprocess.PIPE, stderr=subprocess.DEVNULL,
                          text=True, errors="replace", check=False).stdout


def add(*arguments):
    return int(tavisched("add", "-q", *arguments))


def tasks():
    """All stored tasks by name."""
    return {task["name"]: task for task in json.loads(tavisched("list", "--all", "--json"))}


def runs(task):
    return [json.loads(line) for line in tavisched("history", task, "--json").splitlines()]


def clear():
    """No tasks and no records of runs, which tasks of the same numbers would take for theirs."""
    ids = [task["id"] for task in tasks().values()]
    if ids:
        tavisched("stop", "--after", 0, *ids)
        tavisched("remove", "--yes", *ids)
    for file in "/tmp/sched_status.sqlite", "/var/lib/tavischeduler/runs.sqlite":
        pathlib.Path(file).unlink(missing_ok=True)


def until(condition, what, seconds=10):
    """Waits for a condition and returns what it answered."""
    end = time.monotonic() + seconds
    while not (answer := condition()):
        if time.monotonic() > end:
            raise AssertionError(f"not within {seconds} s: {what}")
        time.sleep(0.05)
    return answer
