// The view in which a task or a power schedule is added or edited. What tavisched refuses stands beside the field
// that it is about.

import { h } from "./dom.js";
import { checkbox, fieldMaker, powerFields, taskFields } from "./fields.js";
import { tell } from "./notices.js";
import { preview, previewCard } from "./preview.js";
import { scheduleFields } from "./schedule-fields.js";
import { newValues, optionsToAdd, optionsToEdit, valuesOf } from "./schedule.js";
import { may } from "./tasks.js";
import { change, readJson } from "./tavisched.js";
import { texts } from "./texts.js";
import { alert, button, go } from "./ui.js";

function today() {
    const now = new Date();
    return new Date(now.getTime() - now.getTimezoneOffset() * 60000).toISOString().slice(0, 10);
}

function titleOf({ id, power, task }) {
    if (power) {
        return id ? texts.editPower : texts.addPower;
    }
    return id ? texts.editTitle(task?.name || "") : texts.addTitle;
}

function leave({ id, power }) {
    if (power) {
        go("power");
    } else if (id) {
        go("task", id);
    } else {
        go();
    }
}

// The command that stores these values, or null when nothing is to be changed.
function commandFor({ id, power, before }, values) {
    if (!id) {
        return ["add", ...optionsToAdd(values, power)];
    }
    const options = optionsToEdit(values, before, power);
    return options.length > 0 ? ["edit", ...options, id] : null;
}

// The times are shown before there is a command to run.
function look(form, seen) {
    const { values } = form;
    const command = commandFor(form, { ...values, command: values.command.trim() === "" ? "true" : values.command });
    if (command) {
        seen.ask(command);
    } else {
        seen.show(form.task);
    }
}

async function store(form, redraw) {
    const command = commandFor(form, form.values);
    if (!command) {
        leave(form);
        return;
    }
    form.isBusy = true;
    redraw();
    try {
        const stored = JSON.parse(await change(command));
        tell(texts.wasSaved(stored.name));
        leave(form);
    } catch (failure) {
        Object.assign(form, { failure, isBusy: false });
        redraw();
        document.querySelector("[aria-invalid=true]")?.focus();
    }
}

function describe(form, set, seen, onsubmit) {
    const { task, values, power } = form;
    const make = fieldMaker(form.failure);
    return h("form", { class: "form", novalidate: true, onsubmit },
        h("h2", null, titleOf(form)),
        h("div", { class: "cards" },
          h("div", { class: "card" },
            power ? powerFields(values, set, task) : taskFields(values, set, make.field, task),
            scheduleFields(values, set, make, power),
            checkbox(texts.isEnabled, values.enabled, event => set("enabled", event.target.checked)),
            !power && checkbox(texts.mayOverlap, values.overlap, event => set("overlap", event.target.checked))),
          previewCard(seen.state)),
        rest(make),
        h("div", { class: "row" },
          h("button", { type: "submit", class: "button primary", disabled: form.isBusy }, texts.save),
          button(texts.cancel, () => leave(form))));
}

function rest(make) {
    const message = make.rest();
    return message && alert("danger", message);
}

// Without an id for a new one.
export function formView(redraw, { id, power = false }) {
    const form = { id, power, task: null, before: null, values: newValues(today()), failure: null, isBusy: false };
    const seen = preview(redraw);

    const set = (name, value) => {
        form.values = { ...form.values, [name]: value };
        look(form, seen);
        redraw();
    };
    const submit = event => {
        event.preventDefault();
        store(form, redraw);
    };
    return {
        get title() { return titleOf(form) },
        isStill: true, // what is being typed is not taken away by a refresh
        close: seen.close,
        async load() {
            if (id) {
                form.task = await readJson(["show", id]);
                form.before = valuesOf(form.task);
                form.values = form.before;
            }
            look(form, seen);
        },
        render: () => form.task && !may.edit(form.task) ? alert("warning", texts.fixed)
                                                        : describe(form, set, seen, submit),
    };
}
