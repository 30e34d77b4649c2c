// When the task of a form would run: tavisched is asked while one types, a moment after the last key.

import { h } from "./dom.js";
import { read } from "./tavisched.js";
import { texts } from "./texts.js";
import { alert, card, moment } from "./ui.js";

const pause = 400; // milliseconds without typing

// Calls back when nobody has typed for a moment, with what the last call brought.
export function preview(redraw) {
    let timer = null;
    let asked = 0;
    const state = { task: null, failure: null };
    return {
        state,
        ask(args) {
            clearTimeout(timer);
            timer = setTimeout(async () => {
                const mine = ++asked;
                const answer = await read([...args, "--dry-run", "--json"]).then(
                    text => ({ task: JSON.parse(text), failure: null }), failure => ({ task: null, failure }));
                if (mine === asked) {
                    Object.assign(state, answer);
                    redraw();
                }
            }, pause);
        },
        show(task) {
            ++asked; // answers on their way are no longer of interest
            clearTimeout(timer);
            Object.assign(state, { task, failure: null });
        },
        close: () => clearTimeout(timer),
    };
}

export function previewCard({ task, failure }) {
    return card(texts.preview, { class: "card preview", "aria-live": "polite" },
        task ? [h("p", null, task.schedule),
                h("ol", { class: "plain-list" }, (task.starts || []).map(time => h("li", null, moment(time)))),
                (task.notes || []).map(note => alert("warning", note))]
             : h("p", { class: "faint" }, failure ? failure.message : texts.noPreview));
}
