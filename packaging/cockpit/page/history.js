// The runs of a task, and what each of them printed; the output of one that goes on grows.

import { h } from "./dom.js";
import { goesOn, kindOf, startOf } from "./tasks.js";
import { follow, readLines } from "./tavisched.js";
import { texts } from "./texts.js";
import { duration, inWords } from "./times.js";
import { button, card, label, table } from "./ui.js";

const step = 10;
const keptText = 256 * 1024; // characters: as much as a browser shows without effort

export function history(id, redraw) {
    let runs = [];
    let limit = step;
    let shown = null; // { run, text, isOver, following, failure }
    let awaited;

    const hide = () => {
        shown?.following.close();
        shown = null;
    };
    const show = run => {
        hide();
        const output = { run: run.run, text: "", isOver: false, failure: null };
        output.following = follow(["log", id, "--run", run.run, "--follow"], text => {
            output.text = (output.text + text).slice(-keptText);
            redraw();
        });
        output.following.ended.catch(failure => { output.failure = failure }).then(() => {
            output.isOver = true;
            redraw();
        });
        shown = output;
        redraw();
    };
    const outputOf = run => h("div", { class: "output", role: "region", "aria-label": texts.outputOf(inWords(startOf(run))) },
        h("pre", { tabindex: 0, class: goesOn(run) && "following" }, shown.text || (shown.isOver ? texts.noOutput : "")),
        shown.failure && h("p", { class: "error" }, shown.failure.message),
        !shown.isOver && goesOn(run) && h("p", { class: "faint" }, texts.following));
    const resultOf = run => {
        const isShown = shown?.run === run.run;
        return [label(kindOf(run), run.result), " ",
                (run.outputSize > 0 || goesOn(run)) &&
                button(texts.output, () => isShown ? (hide(), redraw()) : show(run),
                       { kind: "plain", "aria-expanded": String(isShown) }),
                isShown && outputOf(run)];
    };
    const rowOf = run => ({ key: run.run, cells: [
        inWords(startOf(run)), run.duration === null ? texts.none : duration(run.duration),
        run.byCron ? texts.byCron : run.startedBy || texts.none, resultOf(run)] });

    const load = async () => {
        runs = await readLines(["history", id, "--limit", limit + 1]);
        const newest = runs[0];
        if (awaited !== undefined && newest && newest.run !== awaited && newest.start) {
            awaited = undefined;
            show(newest);
        }
    };
    const showMore = async () => {
        limit += 5 * step;
        await load();
        redraw();
    };

    return {
        load,
        close: hide,
        newest: () => runs[0]?.run ?? null,
        // The run that comes after that one is followed as soon as it has begun.
        followAfter(run) {
            awaited = run;
        },
        isRunning: () => runs.some(goesOn),
        render: () => card(texts.history, { class: "card wide" },
            runs.length === 0
                ? h("p", null, texts.noRuns)
                : table(texts.history, [texts.started, texts.lasted, texts.by, texts.result],
                        runs.slice(0, limit).map(rowOf)),
            runs.length > limit && button(texts.more, showMore)),
    };
}
