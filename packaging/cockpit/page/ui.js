// The building blocks of every view.

import { h } from "./dom.js";
import { texts } from "./texts.js";
import { fromNow, inWords } from "./times.js";

export function go(...path) {
    cockpit.location.go(path.map(String));
}

export function link(text, ...path) {
    return h("a", { href: "#/" + path.join("/") }, text);
}

// Kinds: primary, secondary (as it is without one), danger, plain.
export function button(text, onclick, { kind = "secondary", ...props } = {}) {
    return h("button", { type: "button", class: `button ${kind}`, onclick, ...props }, text);
}

// A word with a colour; the word alone says it all.
export function label(kind, text) {
    return h("span", { class: `label ${kind}` }, text);
}

// A time, and how far away it is.
export function moment(time) {
    return [h("time", { datetime: time }, inWords(time)), " ", h("span", { class: "faint" }, fromNow(time))];
}

export function alert(kind, title, ...body) {
    return h("div", { class: `alert ${kind}`, role: kind === "danger" ? "alert" : "note" },
             h("strong", { class: "alert-title" }, title), body);
}

export function card(title, props, ...children) {
    const id = `card-${title}`.replace(/\W+/g, "-");
    return h("section", { class: "card", "aria-labelledby": id, ...props },
             h("h2", { id }, title), children);
}

export function empty(title, ...body) {
    return h("div", { class: "empty" }, h("h2", null, title), body);
}

export function loading() {
    return h("div", { class: "empty", role: "status" }, h("span", { class: "spinner", "aria-hidden": "true" }),
             texts.loading);
}

// A switch that tells its state by itself.
export function toggle(isOn, name, onchange) {
    return h("label", { class: "switch" },
             h("input", { type: "checkbox", role: "switch", checked: isOn, "aria-label": texts.enabledNamed(name),
                          onchange }),
             h("span", { class: "switch-track", "aria-hidden": "true" }),
             h("span", { "aria-hidden": "true" }, isOn ? texts.enabled : texts.disabled));
}

// Rows of cells; on a narrow screen a row becomes a block, and the cells show their titles. The roles are
// named as such a screen takes them away.
export function table(caption, titles, rows) {
    const cellOf = (cell, column) => column === 0 ? h("th", { role: "rowheader", scope: "row" }, cell)
                                                  : h("td", { role: "cell", "data-title": titles[column] },
                                                    h("div", null, cell));
    return h("table", { class: "table", role: "table" },
             h("caption", { class: "unseen" }, caption),
             h("thead", { role: "rowgroup" }, h("tr", { role: "row" },
               titles.map(title => h("th", { scope: "col", role: "columnheader" }, title)))),
             h("tbody", { role: "rowgroup" },
               rows.map(({ key, cells }) => h("tr", { key, role: "row" }, cells.map(cellOf)))));
}

export function fields(rows) {
    return h("dl", { class: "fields" }, rows.map(([title, value]) =>
        h("div", null, h("dt", null, title), h("dd", null, value))));
}
