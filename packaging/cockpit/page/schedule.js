// What the form holds, and the options of tavisched that say the same.

export const dayNames = ["Sun", "Mon", "Tue", "Wed", "Thu", "Fri", "Sat"];

function two(number) {
    return String(number).padStart(2, "0");
}

export function newValues(today) {
    return { name: "", command: "", kind: "daily", days: [], monthDay: "1", month: "1", yearDay: "1", date: today,
             at: "03:00", every: 0, until: "23", owner: "root", app: "", enabled: true, overlap: false, power: "off" };
}

export function valuesOf(task) {
    return {
        name: task.name, command: task.command, kind: task.type,
        days: Array.isArray(task.week) ? task.week : [],
        monthDay: String(task.startDay || 1), month: String(task.startMonth || 1), yearDay: String(task.startDay || 1),
        date: `${String(task.startYear).padStart(4, "0")}-${two(task.startMonth)}-${two(task.startDay)}`,
        at: `${two(task.runHour)}:${two(task.runMinute)}`, every: task.repeatHour, until: String(task.lastWorkHour),
        owner: task.owner, app: task.app, enabled: task.state === "enabled", overlap: task.canRunTaskSameTime,
        power: task.appArgs === "poweron" ? "on" : "off",
    };
}

// A value may begin with a hyphen, and an empty one is an argument of its own.
function option(name, value) {
    return value === "" ? [`--${name}`, ""] : [`--${name}=${value}`];
}

function dayOption(values) {
    switch (values.kind) {
    case "weekly":
        return option("weekly", values.days.join(","));
    case "monthly":
        return option("monthly", values.monthDay);
    case "yearly":
        return option("yearly", `${two(values.month)}-${two(values.yearDay)}`);
    case "once":
        return option("once", values.date);
    default:
        return ["--daily"];
    }
}

function stateOption(values) {
    return [values.enabled ? "--enabled" : "--disabled"];
}

// Groups of options that belong together; of a change only the groups that changed are given.
function groups(values) {
    return [
        option("name", values.name), option("command", values.command), dayOption(values), option("at", values.at),
        values.every > 0 ? [...option("every", values.every), ...option("until", values.until)] : ["--every=0"],
        option("owner", values.owner), option("app", values.app), stateOption(values),
        [values.overlap ? "--allow-overlap" : "--no-overlap"]];
}

function powerGroups(values) {
    return [values.days.length === 7 ? ["--daily"] : dayOption({ ...values, kind: "weekly" }), option("at", values.at),
            stateOption(values)];
}

export function optionsToAdd(values, isPower) {
    if (isPower) {
        return [`--power=${values.power}`, ...powerGroups(values).flat()];
    }
    const [name, ...others] = groups(values);
    return [...(values.name === "" ? [] : name), ...others.flat()]; // unnamed, it is called by its number
}

export function optionsToEdit(values, before, isPower) {
    const all = isPower ? powerGroups : groups;
    const old = all(before).map(String);
    return all(values).filter((group, which) => String(group) !== old[which]).flat();
}
