// The picture of some days: a row a task, past runs with their results, coming ones, the hours in which the machine
// is off, and minutes at which several tasks start. What has a colour has a shape, too.

import { h } from "./dom.js";
import { kindOf, startOf } from "./tasks.js";
import { texts } from "./texts.js";
import { clockOf, dayOf, inWords, weekdayOf } from "./times.js";

const day = 24 * 3600 * 1000;
const top = 44;
const narrowWidth = 640;
const narrowDay = 108; // less has no room for a whole date
const hourSteps = [1, 3, 6, 12];
const hourRoom = 34; // pixels that a written hour takes

function layoutOf(calendar, width) {
    const isNarrow = width < narrowWidth;
    const from = Date.parse(calendar.from);
    const until = Date.parse(calendar.until);
    const left = isNarrow ? 8 : 190;
    const rowHeight = isNarrow ? 46 : 34;
    const scale = (width - left - 8) / (until - from);
    return {
        isNarrow, from, until, left, rowHeight, width, dayWidth: scale * day,
        height: top + calendar.tasks.length * rowHeight + 8,
        x: time => left + (Math.min(Math.max(Date.parse(time), from), until) - from) * scale,
        middle: row => top + row * rowHeight + rowHeight / 2 + (isNarrow ? 9 : 0),
    };
}

function box(x, y, width, height, props, title) {
    return h("rect", { x, y, width: Math.max(width, 1), height, ...props }, title && h("title", null, title));
}

function path(d, props, title) {
    return h("path", { d, ...props }, title && h("title", null, title));
}

function days(calendar, layout) {
    return calendar.days.map(time => {
        const x = layout.x(time);
        return [h("line", { x1: x, x2: x, y1: 8, y2: layout.height, class: "day-line" }),
                h("text", { x: x + 4, y: 18, class: "day-name" },
                  layout.dayWidth < narrowDay ? `${weekdayOf(time)} ${Number(time.slice(8, 10))}`
                                              : `${weekdayOf(time)} ${dayOf(time)}`),
                hours(x, layout)];
    });
}

function hours(x, layout) {
    const perHour = layout.dayWidth / 24;
    const step = hourSteps.find(each => each * perHour >= hourRoom) || 24;
    const marks = [];
    for (let hour = step; hour < 24; hour += step) {
        const place = x + hour * perHour;
        marks.push(h("line", { x1: place, x2: place, y1: 36, y2: layout.height, class: "hour-line" }));
        marks.push(h("text", { x: place, y: 34, class: "hour-name" }, String(hour).padStart(2, "0")));
    }
    return marks;
}

function offHours(calendar, layout) {
    return calendar.off.map(({ from, until }) =>
        box(layout.x(from), top - 6, layout.x(until) - layout.x(from), layout.height - top, { class: "off", fill: "url(#off-pattern)" },
            `${texts.legend.off}: ${inWords(from)} - ${inWords(until)}`));
}

function busyMinutes(calendar, layout) {
    const names = new Map(calendar.tasks.map(task => [task.id, task.name]));
    return calendar.busy.map(({ time, tasks }) => {
        const x = layout.x(time);
        const title = `${inWords(time)}: ${texts.several(tasks.map(id => names.get(id) || id).join(", "))}`;
        return [h("line", { x1: x, x2: x, y1: top, y2: layout.height, class: "busy-line" }),
                path(`M${x - 5} ${top - 8}h10l-5 8z`, { class: "busy" }, title)];
    });
}

function runMark(run, y, layout) {
    const kind = kindOf(run);
    const x = layout.x(startOf(run));
    const title = `${inWords(startOf(run))}: ${run.result}`;
    const props = { class: `run ${kind}` };
    if (kind === "failed") {
        return path(`M${x - 5} ${y - 5}l10 10m0 -10l-10 10`, props, title);
    }
    if (kind === "missed") {
        return path(`M${x} ${y - 5}l5 5l-5 5l-5 -5z`, props, title);
    }
    const end = run.end ? layout.x(run.end) : layout.x(layout.now);
    return box(x - 4, y - 4, Math.max(end - x, 8), 8, { ...props, rx: 4 }, title);
}

function startMark(task, time, y, layout) {
    const what = task.power === "on" ? texts.switchesOn : task.power === "off" ? texts.switchesOff : texts.willRun;
    return box(layout.x(time) - 2, y - 8, 4, 16, { class: "start", rx: 1 }, `${inWords(time)}: ${task.name} ${what}`);
}

// What lies behind the marks of a row.
function laneOf(row, layout) {
    const y = layout.middle(row);
    return [row % 2 === 1 && box(0, top + row * layout.rowHeight, layout.width, layout.rowHeight, { class: "row-shade" }),
            h("line", { x1: layout.left, x2: layout.width - 8, y1: y, y2: y, class: "row-line" })];
}

function shortened(name, room) {
    const letters = Math.floor(room / 7.2);
    return name.length <= letters ? name : name.slice(0, letters - 1) + "…";
}

function rowOf(task, row, layout) {
    const y = layout.middle(row);
    const nameRoom = layout.isNarrow ? layout.width - 16 : layout.left - 16;
    return h("g", { key: task.id }, h("text", { x: 8, y: layout.isNarrow ? y - 16 : y + 5, class: "row-name" }, shortened(task.name, nameRoom),
          h("title", null, `${task.name}: ${task.schedule}`)),
        task.starts.map(time => startMark(task, time, y, layout)),
        task.runs.map(run => runMark(run, y, layout)));
}

function nowLine(layout) {
    const x = layout.x(layout.now);
    return [h("line", { x1: x, x2: x, y1: 22, y2: layout.height, class: "now-line" },
              h("title", null, `${texts.now}: ${clockOf(layout.now)}`)),
            path(`M${x - 4} 22h8l-4 5z`, { class: "now" })];
}

export function timeline(calendar, width) {
    const layout = { ...layoutOf(calendar, width), now: calendar.now };
    return h("svg", { class: "timeline", role: "img", width, height: layout.height,
                      viewBox: `0 0 ${width} ${layout.height}`,
                      "aria-label": `${texts.timeline}: ${texts.timelineText(
                          calendar.tasks.length, inWords(calendar.from), inWords(calendar.until))}` },
             h("defs", null, h("pattern", { id: "off-pattern", width: 6, height: 6, patternUnits: "userSpaceOnUse" },
               path("M0 6L6 0", { class: "off-line" }))),
             h("g", null, calendar.tasks.map((task, row) => laneOf(row, layout))),
             h("g", null, offHours(calendar, layout)), h("g", null, days(calendar, layout)),
             h("g", null, busyMinutes(calendar, layout)),
             h("g", null, calendar.tasks.map((task, row) => rowOf(task, row, layout))), h("g", null, nowLine(layout)));
}

// What the marks mean; each is drawn as it is in the picture.
export function legend() {
    const sample = (...marks) => h("svg", { width: 18, height: 18, viewBox: "0 0 18 18", "aria-hidden": "true" }, marks);
    const marks = {
        start: sample(box(7, 1, 4, 16, { class: "start", rx: 1 })),
        ok: sample(box(4, 5, 10, 8, { class: "run ok", rx: 4 })),
        failed: sample(path("M4 4l10 10m0 -10l-10 10", { class: "run failed" })),
        running: sample(box(2, 5, 14, 8, { class: "run running", rx: 4 })),
        missed: sample(path("M9 4l5 5l-5 5l-5 -5z", { class: "run missed" })),
        off: sample(box(1, 1, 16, 16, { class: "off", fill: "url(#off-pattern)" })),
        busy: sample(path("M4 5h10l-5 8z", { class: "busy" })),
    };
    return h("ul", { class: "legend" }, Object.entries(marks).map(([what, mark]) =>
        h("li", null, mark, " ", texts.legend[what])));
}
