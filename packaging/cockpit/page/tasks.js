// What the page knows of a task or a run beyond its members: kinds, permissions, results.

import { texts } from "./texts.js";

const powerBackend = -3;
const status = { interrupted: 1, running: 2, ok: 3, waiting: 32, stopped: 33, removed: 38, disabled: 39, missed: 40 };

export function isPower(task) {
    return task.backend === powerBackend;
}

export function isEnabled(task) {
    return task.state === "enabled";
}

export function isRunning(task) {
    return Boolean(task.lastRun) && goesOn(task.lastRun);
}

export function goesOn(run) {
    return run.statusCode === status.running || run.statusCode === status.waiting;
}

// The kind of a result: running, ok, missed (nothing was started) or failed.
export function kindOf(run) {
    if (goesOn(run)) {
        return "running";
    }
    if (run.statusCode === status.ok) {
        return "ok";
    }
    const isMissed = [status.missed, status.removed, status.disabled].includes(run.statusCode);
    return isMissed ? "missed" : "failed";
}

export function startOf(run) {
    return run.start || run.waitingSince || run.asked || run.due;
}

// What the record lets an interface do.
export const may = {
    edit: task => task.canEditFromUI,
    rename: task => task.canEditFromUI && task.canEditName,
    changeOwner: task => task.canEditFromUI && task.canEditOwner,
    run: task => task.canRunFromUI,
    remove: task => task.canDeleteFromUI,
};

export function powerName(task) {
    return task.appArgs === "poweron" ? texts.powerOn : texts.powerOff;
}
