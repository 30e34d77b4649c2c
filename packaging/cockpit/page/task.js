// The view of one task: every field, its coming runs, its history, and what can be done with it.

import { remove, run, stop } from "./actions.js";
import { h } from "./dom.js";
import { history } from "./history.js";
import { nextStart, runLabel, stateOf } from "./list.js";
import { isPower, isRunning, may } from "./tasks.js";
import { readJson } from "./tavisched.js";
import { texts } from "./texts.js";
import { alert, button, card, fields, go, link, moment } from "./ui.js";

const flags = ["listable", "canEditFromUI", "canEditName", "canEditOwner", "canRunFromUI", "canDeleteFromUI",
               "simpleEditForm"];
const others = ["id", "type", "week", "firstDay", "time", "repeatHour", "lastWorkHour", "ownerId", "appName", "appArgs",
                "action", "editDialog", "editForm"];

function two(number) {
    return String(number).padStart(2, "0");
}

function inText(task, field) {
    switch (field) {
    case "week":
        return Array.isArray(task.week) ? task.week.join(", ") : task.week;
    case "firstDay":
        return task.startDay === 0 ? "" : `${task.startYear}-${two(task.startMonth)}-${two(task.startDay)}`;
    case "time":
        return `${two(task.runHour)}:${two(task.runMinute)}`;
    default:
        return String(task[field]);
    }
}

function allFields(task) {
    return h("details", null, h("summary", null, texts.allFields), fields([
        ...others.map(field => [texts.fields[field], inText(task, field) || texts.none]),
        ...flags.map(field => [texts.fields[field], task[field] ? texts.yes : texts.no])]));
}

function details(task) {
    return card(texts.details, null, fields([
        [texts.state, stateOf(task)],
        [texts.schedule, task.schedule],
        [texts.next, nextStart(task)],
        [texts.lastRun, runLabel(task.lastRun)],
        [texts.owner, task.owner],
        [texts.command, h("pre", { class: "command" }, task.command || texts.none)],
        [texts.app, task.app || texts.none],
        [texts.overlap, task.canRunTaskSameTime ? texts.overlapStarts : texts.overlapWaits],
        [texts.appOverlap, task.canRunAppSameTime ? texts.overlapStarts : texts.overlapWaits],
    ]), allFields(task));
}

function coming(starts) {
    return card(texts.coming, null, starts.length === 0
        ? h("p", null, texts.noComing)
        : h("ol", { class: "plain-list" }, starts.map(time => h("li", null, moment(time)))));
}

export function taskView(redraw, id) {
    const runs = history(id, redraw);
    let task = null;

    const runNow = async () => {
        runs.followAfter(runs.newest());
        if (!await run(task)) {
            runs.followAfter(undefined);
        }
    };
    const buttons = () => h("div", { class: "row" },
        may.run(task) && !isRunning(task) && button(texts.run, runNow, { kind: "primary" }),
        may.run(task) && isRunning(task) && button(texts.stop, () => stop(task)),
        may.edit(task) && button(texts.edit, () => go(isPower(task) ? "power" : "task", id, "edit")),
        may.remove(task) && button(texts.remove, async () => await remove(task) && go(), { kind: "danger" }));

    return {
        get title() { return task?.name || texts.task },
        isRunning: () => runs.isRunning(),
        close: runs.close,
        async load() {
            [task] = await Promise.all([readJson(["show", id]), runs.load()]);
        },
        render: () => task && [
            h("p", { class: "back" }, link(texts.toList)),
            h("div", { class: "row spread" }, h("h2", { class: "name" }, task.name), buttons()),
            (task.notes || []).map(note => alert("warning", note)),
            h("div", { class: "cards" }, details(task), coming(task.starts || [])), runs.render()],
    };
}
