// Tells when something may have changed: at once when the files of tasks and runs change, and every now
// and then, as times go by. Nothing is watched while the page is not visible.

const files = ["/tmp/scheduled_tasks", "/usr/tavi/etc/auto_power", "/tmp/sched_status.sqlite",
               "/var/lib/tavischeduler/runs.sqlite"];
const settle = 250;    // milliseconds: a change touches several files
const interval = 30000;
const whileRunning = 3000;

// `isRunning` answers whether a run goes on, which writes files seldom.
export function watchChanges(onChange, isRunning) {
    let channels = [];
    let timer = null;
    let last = 0;

    const tell = () => {
        last = Date.now();
        onChange();
    };
    const soon = () => {
        clearTimeout(timer);
        timer = setTimeout(tell, settle);
    };
    const open = () => {
        channels = files.map(path => {
            const channel = cockpit.channel({ payload: "fswatch1", path, superuser: "try" });
            channel.addEventListener("message", soon);
            return channel;
        });
    };
    const close = () => {
        clearTimeout(timer);
        channels.forEach(channel => channel.close());
        channels = [];
    };
    const onVisibility = () => {
        close();
        if (!cockpit.hidden && !document.hidden) {
            open();
            soon();
        }
    };

    setInterval(() => {
        if (channels.length > 0 && Date.now() - last >= (isRunning() ? whileRunning : interval)) {
            tell();
        }
    }, 1000);
    cockpit.addEventListener("visibilitychange", onVisibility);
    document.addEventListener("visibilitychange", onVisibility);
    open();
}
