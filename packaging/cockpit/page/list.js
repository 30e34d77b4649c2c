// The view of all tasks: search, filter, and a row a task.

import { run, setEnabled, stop } from "./actions.js";
import { h } from "./dom.js";
import { exportTasks } from "./exchange.js";
import { isEnabled, isPower, isRunning, kindOf, may, startOf } from "./tasks.js";
import { readJson } from "./tavisched.js";
import { texts } from "./texts.js";
import { fromNow } from "./times.js";
import { button, empty, go, label, link, moment, table, toggle } from "./ui.js";

const filters = {
    all: () => true,
    enabled: isEnabled,
    disabled: task => !isEnabled(task),
    running: isRunning,
    failed: task => Boolean(task.lastRun) && kindOf(task.lastRun) === "failed",
};

const step = 200; // rows that a browser shows without effort

// What was searched for stays when one comes back from a task.
const everything = { words: "", filter: "all", owner: "" };
const wanted = { ...everything };

function matches(task) {
    const text = `${task.name}\n${task.owner}\n${task.app}`.toLowerCase();
    return wanted.words.toLowerCase().split(/\s+/).every(word => text.includes(word)) &&
           filters[wanted.filter](task) && (wanted.owner === "" || task.owner === wanted.owner);
}

export function runLabel(lastRun) {
    return lastRun ? [label(kindOf(lastRun), lastRun.result), " ",
                      h("span", { class: "faint" }, fromNow(startOf(lastRun)))]
                   : texts.none;
}

export function nextStart(task) {
    return task.nextStart ? moment(task.nextStart) : texts.never;
}

export function stateOf(task) {
    return may.edit(task) ? toggle(isEnabled(task), task.name, event => switchState(task, event.target))
                          : isEnabled(task) ? texts.enabled : texts.disabled;
}

async function switchState(task, input) {
    if (!await setEnabled(task, input.checked)) {
        input.checked = isEnabled(task);
    }
}

function actionsOf(task) {
    if (!may.run(task)) {
        return null;
    }
    return isRunning(task)
        ? button(texts.stop, () => stop(task), { key: "stop", "aria-label": texts.stopNamed(task.name) })
        : button(texts.run, () => run(task), { key: "run", "aria-label": texts.runNamed(task.name) });
}

function rowOf(task) {
    const notes = task.notes || [];
    return { key: task.id, cells: [
        [link(task.name, "task", task.id), notes.length > 0 && h("span", { class: "note" }, notes.join("; "))],
        stateOf(task), task.schedule, nextStart(task), task.owner, runLabel(task.lastRun), actionsOf(task)] };
}

function choice(name, value, options, onchange) {
    return h("label", { class: "field" }, name,
             h("select", { value, onchange: event => onchange(event.target.value) },
               options.map(([key, text]) => h("option", { value: key }, text))));
}

export function listView(redraw) {
    let tasks = [];
    let limit = step;

    const choose = (what, value) => {
        wanted[what] = value;
        limit = step;
        redraw();
    };
    const toolbar = () => {
        const owners = [...new Set(tasks.map(task => task.owner))].sort();
        return h("div", { class: "toolbar", role: "search" },
            h("label", { class: "field grows" }, texts.search,
              h("input", { type: "search", value: wanted.words, placeholder: texts.searchHint,
                           oninput: event => choose("words", event.target.value) })),
            choice(texts.filter, wanted.filter, Object.entries(texts.filters), value => choose("filter", value)),
            choice(texts.owners, wanted.owner, [["", texts.anyOwner], ...owners.map(owner => [owner, owner])],
                   value => choose("owner", value)));
    };
    const body = () => {
        const shown = tasks.filter(matches);
        if (tasks.length === 0) {
            return empty(texts.noTasks, h("p", null, texts.noTasksText),
                         button(texts.add, () => go("add"), { kind: "primary" }));
        }
        if (shown.length === 0) {
            return empty(texts.noMatch, button(texts.clear, () => {
                Object.assign(wanted, everything);
                redraw();
            }));
        }
        return [
            table(texts.tasks, [texts.name, texts.state, texts.schedule, texts.next, texts.owner, texts.lastRun,
                                texts.actions], shown.slice(0, limit).map(rowOf)),
            shown.length > limit && button(texts.more, () => {
                limit += 5 * step;
                redraw();
            }),
            h("p", { class: "faint", role: "status" }, texts.shown(shown.length, tasks.length))];
    };
    return {
        title: texts.tasks,
        isRunning: () => tasks.some(isRunning),
        async load() {
            tasks = (await readJson(["list"], { accepted: [1] })).filter(task => !isPower(task));
        },
        render: () => [
            h("div", { class: "row spread" }, h("h2", null, texts.tasks), h("div", { class: "row" },
              button(texts.import, () => go("import")), button(texts.export, exportTasks),
              button(texts.add, () => go("add"), { kind: "primary" }))),
            tasks.length > 0 && toolbar(), body()],
    };
}
