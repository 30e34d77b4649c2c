// The view in which a task or a power schedule is added or edited. What tavisched refuses stands beside the field
// that it is about; while one types, it is asked when the task would run.

import { h } from "./dom.js";
import { tell } from "./notices.js";
import { scheduleFields } from "./schedule-fields.js";
import { newValues, optionsToAdd, optionsToEdit, valuesOf } from "./schedule.js";
import { isPower, may, powerName } from "./tasks.js";
import { change, read, readJson } from "./tavisched.js";
import { texts } from "./texts.js";
import { alert, button, card, go, moment } from "./ui.js";

const pause = 400; // milliseconds without typing

// Calls back when nobody has typed for a moment, with what the last call brought.
function preview(redraw) {
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

// Makes controls with their names, hints and what is wrong with them: the errors of the option of that name. Those
// of options that have no control are left, for `rest`.
function fieldMaker(failure) {
    const placed = new Set();
    const errorOf = option => {
        placed.add(option);
        return failure?.option === option ? failure.message : null;
    };
    const field = (title, option, control, hint) => {
        const id = `field-${option}`;
        const error = errorOf(option);
        const described = [hint && `${id}-hint`, error && `${id}-error`].filter(Boolean).join(" ");
        return h("div", { class: error ? "field wrong" : "field" },
                 h("label", { for: id }, title),
                 control({ id, "aria-invalid": error && "true", "aria-describedby": described || null }),
                 hint && h("p", { id: `${id}-hint`, class: "faint" }, hint),
                 error && h("p", { id: `${id}-error`, class: "error", role: "alert" }, error));
    };
    return { field, errorOf, rest: () => failure && !placed.has(failure.option) ? failure.message : null };
}

function checkbox(title, checked, onchange) {
    return h("label", { class: "check" }, h("input", { type: "checkbox", checked, onchange }), title);
}

function fixed(title, value) {
    return h("div", { class: "field" }, h("span", { class: "field-name" }, title), h("span", null, value || texts.none),
             h("p", { class: "faint" }, texts.fixed));
}

function taskFields(values, set, field, task) {
    const text = (name, more) => props => h("input", { type: "text", value: values[name], ...more, ...props,
                                                       oninput: event => set(name, event.target.value) });
    return [
        task && !may.rename(task) ? fixed(texts.name, task.name)
                                  : field(texts.name, "name", text("name"), task ? null : texts.nameHint),
        field(texts.command, "command", props =>
            h("textarea", { rows: 2, spellcheck: "false", class: "code", value: values.command, required: true, ...props,
                            oninput: event => set("command", event.target.value) }), texts.commandHint),
        task && !may.changeOwner(task) ? fixed(texts.owner, task.owner)
                                       : field(texts.owner, "owner", text("owner", { autocapitalize: "off" })),
        field(texts.app, "app", text("app")),
    ];
}

function powerFields(values, set, task) {
    return task
        ? h("p", null, h("strong", null, powerName(task)))
        : h("fieldset", { class: "field" }, h("legend", null, texts.what), h("div", { class: "row" },
            [["on", texts.powerOn], ["off", texts.powerOff]].map(([value, title]) =>
                h("label", { class: "check" },
                  h("input", { type: "radio", name: "power", checked: values.power === value,
                               onchange: () => set("power", value) }), title))));
}

function previewCard({ task, failure }) {
    return card(texts.preview, { class: "card preview", "aria-live": "polite" },
        task ? [h("p", null, task.schedule),
                h("ol", { class: "plain-list" }, (task.starts || []).map(time => h("li", null, moment(time)))),
                (task.notes || []).map(note => alert("warning", note))]
             : h("p", { class: "faint" }, failure ? failure.message : texts.noPreview));
}

function today() {
    const now = new Date();
    return new Date(now.getTime() - now.getTimezoneOffset() * 60000).toISOString().slice(0, 10);
}

function rest(make) {
    const message = make.rest();
    return message && alert("danger", message);
}

// Without an id for a new one.
export function formView(redraw, { id, power = false }) {
    const state = { failure: null, isBusy: false };
    const seen = preview(redraw);
    let task = null;
    let values = newValues(today());
    let before = null;

    // The times are shown before there is a command.
    const look = () => {
        const { command } = values;
        const known = { ...values, command: command.trim() === "" ? "true" : command };
        const options = id ? optionsToEdit(known, before, power) : optionsToAdd(known, power);
        if (!id) {
            seen.ask(["add", ...options]);
        } else if (options.length > 0) {
            seen.ask(["edit", ...options, id]);
        } else {
            seen.show(task);
        }
    };
    const set = (name, value) => {
        values = { ...values, [name]: value };
        look();
        redraw();
    };
    const back = () => power ? go("power") : id ? go("task", id) : go();
    const focusError = () => document.querySelector("[aria-invalid=true]")?.focus();
    const save = async event => {
        event.preventDefault();
        const options = id ? optionsToEdit(values, before, power) : optionsToAdd(values, power);
        if (options.length === 0) {
            back();
            return;
        }
        state.isBusy = true;
        redraw();
        try {
            const stored = JSON.parse(await change(id ? ["edit", ...options, id] : ["add", ...options]));
            tell(texts.wasSaved(stored.name));
            back();
        } catch (failure) {
            Object.assign(state, { failure, isBusy: false });
            redraw();
            focusError();
        }
    };
    const title = () => power ? (id ? texts.editPower : texts.addPower) : id ? texts.editTitle(task?.name || "") : texts.addTitle;

    return {
        get title() { return title() },
        isStill: true, // what is being typed is not taken away by a refresh
        close: seen.close,
        async load() {
            if (id) {
                task = await readJson(["show", id]);
                before = valuesOf(task);
                values = before;
            }
            look();
        },
        render() {
            const make = fieldMaker(state.failure);
            if (task && !may.edit(task)) {
                return alert("warning", texts.fixed);
            }
            return h("form", { class: "form", novalidate: true, onsubmit: save },
                h("h2", null, title()),
                h("div", { class: "cards" },
                  h("div", { class: "card" },
                    power ? powerFields(values, set, task) : taskFields(values, set, make.field, task),
                    scheduleFields(values, set, make, power),
                    checkbox(texts.isEnabled, values.enabled, event => set("enabled", event.target.checked)),
                    !power && checkbox(texts.mayOverlap, values.overlap, event => set("overlap", event.target.checked))),
                  previewCard(seen.state)),
                rest(make),
                h("div", { class: "row" },
                  h("button", { type: "submit", class: "button primary", disabled: state.isBusy }, texts.save),
                  button(texts.cancel, back)));
        },
    };
}
