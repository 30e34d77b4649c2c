// A question that must be answered before anything else goes on.

import { h, render } from "./dom.js";
import { texts } from "./texts.js";
import { button } from "./ui.js";

// Whether it was agreed to. Escape and "Cancel" do not agree; the focus goes back to where it was.
export function ask(title, text, confirm) {
    const place = document.getElementById("dialog");
    return new Promise(resolve => {
        const answer = agreed => place.firstElementChild.close(agreed ? "yes" : "");
        const onclose = event => {
            resolve(event.target.returnValue === "yes");
            render(place);
        };
        render(place, h("dialog", { class: "dialog", "aria-labelledby": "question", "aria-describedby": "question-text",
                                    onclose, made: node => setTimeout(() => node.showModal()) },
                        h("h2", { id: "question" }, title),
                        h("p", { id: "question-text" }, text),
                        h("div", { class: "row" },
                          button(confirm, () => answer(true), { kind: "danger" }),
                          button(texts.cancel, () => answer(false), { autofocus: true }))));
    });
}
