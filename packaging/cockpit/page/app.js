// Which view is shown, when it is loaded, and the frame around it.

import { watchChanges } from "./changes.js";
import { h, render } from "./dom.js";
import { importView } from "./exchange.js";
import { formView } from "./form.js";
import { listView } from "./list.js";
import { findings, machineView } from "./machine.js";
import { powerView } from "./power.js";
import { taskView } from "./task.js";
import { changes } from "./tavisched.js";
import { texts } from "./texts.js";
import { followTheme } from "./theme.js";
import { alert, button, link, loading } from "./ui.js";
import { weekView } from "./week.js";

const tabs = [["", texts.tasks], ["week", texts.week], ["power", texts.power], ["machine", texts.machine]];
const admin = cockpit.permission({ admin: true });
const main = document.getElementById("main");
let shown = null; // the view, whether it is loaded, and why it could not be
let problems = 0;

function viewFor(path, redraw) {
    const [place, id, action] = path;
    switch (place) {
    case "add":
        return formView(redraw, {});
    case "task":
        return action === "edit" ? formView(redraw, { id }) : taskView(redraw, id);
    case "week":
        return weekView(redraw);
    case "power":
        return id ? formView(redraw, { id: id === "add" ? undefined : id, power: true }) : powerView();
    case "machine":
        return machineView(redraw, countProblems);
    case "import":
        return importView(redraw);
    default:
        return listView(redraw);
    }
}

function countProblems(found) {
    problems = found.filter(finding => finding.problem).length;
    drawHeader();
}

function drawHeader() {
    const place = cockpit.location.path[0] || "";
    const current = ["task", "add", "import"].includes(place) ? "" : place;
    render(document.getElementById("header"),
        h("h1", null, texts.title),
        h("nav", { "aria-label": texts.views }, tabs.map(([path, name]) =>
            h("a", { href: `#/${path}`, "aria-current": current === path && "page" }, name,
              path === "machine" && problems > 0 && h("span", { class: "badge", title: texts.problems(problems) },
                  h("span", { "aria-hidden": "true" }, problems), h("span", { class: "unseen" }, texts.problems(problems)))))));
}

function cannotLoad(part) {
    return admin.allowed === false
        ? alert("info", texts.noAccess)
        : alert("danger", texts.cannotLoad, h("p", null, part.failure.message),
                h("div", { class: "row" }, button(texts.tryAgain, () => load(part)), link(texts.toList)));
}

function draw(part) {
    if (part !== shown) {
        return; // an answer to a view that was left
    }
    const { view, isLoaded, failure } = part;
    render(main, failure && cannotLoad(part), isLoaded ? h("div", { key: part.key }, view.render()) : !failure && loading());
    document.title = `${view.title} - ${texts.title}`;
}

// One load at a time; what changes meanwhile leads to another one.
async function load(part) {
    if (part.isLoading) {
        part.isOutdated = true;
        return;
    }
    part.isLoading = true;
    do {
        part.isOutdated = false;
        try {
            await part.view.load();
            Object.assign(part, { failure: null, isLoaded: true });
        } catch (failure) {
            Object.assign(part, { failure, isLoaded: part.isLoaded && Boolean(part.view.isStill) });
        }
    } while (part.isOutdated && part === shown);
    part.isLoading = false;
    draw(part);
}

function open() {
    const path = cockpit.location.path;
    shown?.view.close?.();
    const part = { isLoaded: false, failure: null, key: path.join("/") || "list" };
    part.view = viewFor(path, () => draw(part));
    const isFirst = shown === null;
    shown = part;
    drawHeader();
    draw(part);
    load(part);
    if (!isFirst) {
        main.focus({ preventScroll: true }); // a screen reader goes on with the new view
        window.scrollTo(0, 0);
    }
}

function refresh() {
    if (!shown.view.isStill || !shown.isLoaded) {
        load(shown);
    }
}

async function lookAtMachine() {
    countProblems(await findings().catch(() => []));
}

cockpit.transport.wait(() => {
    document.documentElement.lang = (cockpit.language || "en").replace("_", "-");
    followTheme();
    cockpit.addEventListener("locationchanged", open);
    open();
    lookAtMachine();
    changes.addEventListener("changed", refresh);
    watchChanges(refresh, () => Boolean(shown.view.isRunning?.()));
    admin.addEventListener("changed", refresh);
});
