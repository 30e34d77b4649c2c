// Tasks from and to a file. An import tells first what would come of it.

import { h } from "./dom.js";
import { tell, tellFailure } from "./notices.js";
import { change, read } from "./tavisched.js";
import { texts } from "./texts.js";
import { alert, button, go } from "./ui.js";

export async function exportTasks() {
    try {
        const file = new Blob([await read(["export"])], { type: "application/json" });
        const link = document.createElement("a");
        link.href = URL.createObjectURL(file);
        link.download = "tasks.json";
        link.click();
        URL.revokeObjectURL(link.href);
    } catch (failure) {
        tellFailure(failure);
    }
}

export function importView(redraw) {
    const state = { text: null, replaces: false, lines: null, failure: null };

    const argumentsFor = (...more) => ["import", ...more, ...(state.replaces ? ["--replace"] : []), "-"];
    const look = async () => {
        Object.assign(state, { lines: null, failure: null });
        if (state.text !== null) {
            try {
                const told = await read([...argumentsFor("--dry-run"), "--json"], { input: state.text });
                state.lines = told.split("\n").filter(line => line);
            } catch (failure) {
                state.failure = failure;
            }
        }
        redraw();
    };
    const choose = async event => {
        const file = event.target.files[0];
        state.text = file ? await file.text() : null;
        await look();
    };
    const store = async () => {
        try {
            await change(argumentsFor(), { input: state.text });
            tell(texts.imported);
            go();
        } catch (failure) {
            state.failure = failure;
            redraw();
        }
    };
    return {
        title: texts.importTitle,
        isStill: true,
        async load() {},
        render: () => h("div", { class: "form" },
            h("h2", null, texts.importTitle), h("p", null, texts.importText),
            h("div", { class: "card" },
              h("div", { class: "field" }, h("label", { for: "import-file" }, texts.file),
                h("input", { id: "import-file", type: "file", accept: ".json,application/json", onchange: choose })),
              h("label", { class: "check" },
                h("input", { type: "checkbox", checked: state.replaces, onchange: event => {
                    state.replaces = event.target.checked;
                    look();
                } }), texts.replace),
              state.lines && [h("h3", null, texts.wouldCome),
                              h("ul", { id: "import-lines" }, state.lines.map(line => h("li", null, line)))],
              state.failure && alert("danger", texts.importTitle, h("pre", { class: "command" }, state.failure.message))),
            h("div", { class: "row" },
              button(texts.import, store, { kind: "primary", disabled: !state.lines }),
              button(texts.cancel, () => go()))),
    };
}
