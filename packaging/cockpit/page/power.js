// The view of the power schedules, the times at which the machine goes on or off.

import { removePower } from "./actions.js";
import { h } from "./dom.js";
import { nextStart, stateOf } from "./list.js";
import { isPower, may, powerName } from "./tasks.js";
import { readJson } from "./tavisched.js";
import { texts } from "./texts.js";
import { button, empty, go, label, table } from "./ui.js";

// A schedule gets another id when it is enabled or disabled, but stays in its row, and the focus with it.
function rows(schedules) {
    const count = new Map();
    return schedules.map(task => {
        const what = `${powerName(task)}, ${task.schedule}`;
        count.set(what, (count.get(what) || 0) + 1);
        return rowOf(task, what, `${what} ${count.get(what)}`);
    });
}

function rowOf(task, what, key) {
    return { key, cells: [
        label(task.appArgs, powerName(task)), task.schedule, nextStart(task), stateOf({ ...task, name: what }),
        h("div", { class: "row" },
          may.edit(task) && button(texts.edit, () => go("power", task.id, "edit"), { "aria-label": `${texts.edit}: ${what}` }),
          may.remove(task) && button(texts.remove, () => removePower(task, what), { "aria-label": `${texts.remove}: ${what}` }))] };
}

export function powerView() {
    let schedules = [];
    return {
        title: texts.power,
        async load() {
            schedules = (await readJson(["list"], { accepted: [1] })).filter(isPower);
        },
        render: () => [
            h("div", { class: "row spread" }, h("h2", null, texts.power),
              button(texts.addPower, () => go("power", "add"), { kind: "primary" })),
            h("p", null, texts.powerText),
            schedules.length === 0
                ? empty(texts.noPower)
                : table(texts.power, [texts.what, texts.schedule, texts.next, texts.state, texts.actions], rows(schedules))],
    };
}
