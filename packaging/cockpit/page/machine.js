// The view of what "tavisched check" finds, with the button that repairs.

import { h } from "./dom.js";
import { tell, tellFailure } from "./notices.js";
import { change, readLines } from "./tavisched.js";
import { texts } from "./texts.js";
import { alert, button, link, loading } from "./ui.js";

// Problems make the command end with 1.
export function findings() {
    return readLines(["check"], { accepted: [1] });
}

function findingCard(finding) {
    return h("li", { key: finding.what }, alert(finding.problem ? "danger-quiet" : "info",
        `${finding.problem ? texts.problem : texts.note}: ${finding.what}`,
        h("p", null, finding.advice), finding.task && h("p", null, link(texts.toTask(finding.task), "task", finding.task))));
}

export function machineView(redraw, onFindings) {
    let found = null;

    const load = async () => {
        found = await findings();
        onFindings(found);
    };
    const repair = async () => {
        try {
            const lines = (await change(["check", "--repair"], { accepted: [1] })).split("\n").filter(line => line);
            const repaired = lines.map(line => JSON.parse(line)).filter(line => line.repaired);
            repaired.forEach(line => tell(texts.repaired(line.what)));
            if (repaired.length === 0) {
                tell(texts.nothingRepaired);
            }
        } catch (failure) {
            tellFailure(failure);
        }
        await load();
        redraw();
    };
    return {
        title: texts.machine,
        load,
        render: () => [
            h("div", { class: "row spread" }, h("h2", null, texts.machine),
              found?.some(finding => finding.canRepair) && button(texts.repair, repair, { kind: "primary" })),
            h("p", null, texts.machineText),
            !found ? loading()
                   : found.length === 0 ? alert("success", texts.allWell)
                                        : h("ul", { class: "findings" }, found.map(findingCard))],
    };
}
