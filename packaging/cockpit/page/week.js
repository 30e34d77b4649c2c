// The view of the coming days: the picture, and the same as a table.

import { h } from "./dom.js";
import { goesOn, kindOf, startOf } from "./tasks.js";
import { readJson } from "./tavisched.js";
import { texts } from "./texts.js";
import { inWords } from "./times.js";
import { legend, timeline } from "./timeline.js";
import { empty, label, link, table } from "./ui.js";

const choices = [1, 3, 7, 14];
const mostRows = 300;
let shownDays = matchMedia("(max-width: 40rem)").matches ? 3 : 7; // stays when one comes back

// A disabled task has nothing to show, unless it has run.
function hasMarks(task) {
    return task.state === "enabled" || task.runs.length > 0;
}

function whatComes(task) {
    return task.power === "on" ? texts.switchesOn : task.power === "off" ? texts.switchesOff : texts.willRun;
}

function entriesOf(task) {
    const place = task.power ? ["power"] : ["task", task.id];
    return [...task.runs.map(run => ({ time: startOf(run), key: `run${run.run}`, what: label(kindOf(run), run.result) })),
            ...task.starts.map(time => ({ time, key: `${task.id} ${time}`, what: whatComes(task) }))]
            .map(entry => ({ ...entry, name: link(task.name, ...place) }));
}

function asTable(calendar) {
    const entries = calendar.tasks.flatMap(entriesOf).sort((a, b) => Date.parse(a.time) - Date.parse(b.time));
    const busy = new Set(calendar.busy.map(each => each.time));
    return h("details", null, h("summary", null, texts.asTable),
        table(texts.timeline, [texts.when2, texts.task, texts.result], entries.slice(0, mostRows).map(
            ({ key, time, name, what }) => ({ key, cells: [
                inWords(time), name, [what, busy.has(time) && [" ", label("warning", texts.legend.busy)]]] }))),
        entries.length > mostRows && h("p", { class: "faint" }, texts.first(mostRows)));
}

export function weekView(redraw) {
    let calendar = null;
    let place = null;
    const observer = new ResizeObserver(() => redraw());

    const chooseDays = async days => {
        shownDays = days;
        await load();
        redraw();
    };
    const load = async () => {
        const all = await readJson(["calendar", "--days", shownDays]);
        calendar = { ...all, tasks: all.tasks.filter(hasMarks) };
    };
    const watchWidth = node => {
        place = node;
        observer.observe(node);
    };
    return {
        title: texts.week,
        load,
        close: () => observer.disconnect(),
        isRunning: () => Boolean(calendar?.tasks.some(task => task.runs.some(goesOn))),
        render: () => [
            h("div", { class: "row spread" }, h("h2", null, texts.week),
              h("label", { class: "field inline" }, texts.daysShown,
                h("select", { value: shownDays, onchange: event => chooseDays(Number(event.target.value)) },
                  choices.map(days => h("option", { value: days }, texts.daysCount(days)))))),
            h("div", { class: "card wide" },
              h("div", { class: "timeline-place", made: watchWidth },
                calendar && place && calendar.tasks.length > 0 && timeline(calendar, place.clientWidth)),
              calendar && (calendar.tasks.length > 0 ? [legend(), asTable(calendar)] : empty(texts.nothingToShow)))],
    };
}
