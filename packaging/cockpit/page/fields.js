// The fields of the form, but for those of the schedule.

import { h } from "./dom.js";
import { may, powerName } from "./tasks.js";
import { texts } from "./texts.js";

// Makes controls with their names, hints and what is wrong with them: the errors of the option of that name. Those
// of options that have no control are left, for `rest`.
export function fieldMaker(failure) {
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

export function checkbox(title, checked, onchange) {
    return h("label", { class: "check" }, h("input", { type: "checkbox", checked, onchange }), title);
}

function fixed(title, value) {
    return h("div", { class: "field" }, h("span", { class: "field-name" }, title), h("span", null, value || texts.none),
             h("p", { class: "faint" }, texts.fixed));
}

export function taskFields(values, set, field, task) {
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

export function powerFields(values, set, task) {
    return task
        ? h("p", null, h("strong", null, powerName(task)))
        : h("fieldset", { class: "field" }, h("legend", null, texts.what), h("div", { class: "row" },
            [["on", texts.powerOn], ["off", texts.powerOff]].map(([value, title]) =>
                h("label", { class: "check" },
                  h("input", { type: "radio", name: "power", checked: values.power === value,
                               onchange: () => set("power", value) }), title))));
}
