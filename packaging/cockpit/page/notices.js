// Short messages about what was done, which go by themselves, and failures, which stay until dismissed.

import { h, render } from "./dom.js";
import { texts } from "./texts.js";
import { button } from "./ui.js";

const shownFor = 8000;
let notices = [];
let count = 0;

function draw() {
    render(document.getElementById("notices"), notices.map(notice =>
        h("div", { key: notice.key, class: `alert ${notice.kind}` },
          h("span", { class: "alert-title" }, notice.text),
          button("×", () => dismiss(notice), { kind: "plain", "aria-label": texts.dismiss }))));
}

function dismiss(notice) {
    notices = notices.filter(other => other !== notice);
    draw();
}

function show(kind, text) {
    const notice = { kind, text, key: `notice${++count}` };
    notices = [...notices, notice];
    draw();
    return notice;
}

export function tell(text) {
    const notice = show("success", text);
    setTimeout(() => dismiss(notice), shownFor);
}

export function tellFailure(failure) {
    show("danger", failure.message);
}
