// The fields of a schedule: which days, at what time, how often in a day.

import { h } from "./dom.js";
import { dayNames } from "./schedule.js";
import { texts } from "./texts.js";

const hours = [...Array(24).keys()];

function select(value, options, onchange) {
    return props => h("select", { value, ...props, onchange: event => onchange(event.target.value) },
        options.map(([key, text]) => h("option", { value: key }, text)));
}

function number(values, set, name, largest) {
    return props => h("input", { type: "number", min: 1, max: largest, value: values[name], ...props,
                                 oninput: event => set(name, event.target.value) });
}

function weekDays(values, set, error) {
    const toggleDay = (day, isOn) => set("days", dayNames.filter(name =>
        name === day ? isOn : values.days.includes(name)));
    return h("fieldset", { class: error ? "field wrong" : "field", "aria-describedby": error && "field-weekly-error" },
        h("legend", null, texts.days),
        h("div", { class: "row" }, dayNames.map((day, index) => h("label", { class: "check" },
            h("input", { type: "checkbox", checked: values.days.includes(day), "aria-label": texts.longWeekdays[index],
                         "aria-invalid": error && "true", onchange: event => toggleDay(day, event.target.checked) }),
            h("span", { "aria-hidden": "true" }, texts.weekdays[index])))),
        error && h("p", { id: "field-weekly-error", class: "error", role: "alert" }, error));
}

function dayFields(values, set, field, errorOf) {
    switch (values.kind) {
    case "weekly":
        return weekDays(values, set, errorOf("weekly"));
    case "monthly":
        return field(texts.monthDay, "monthly", number(values, set, "monthDay", 31));
    case "yearly":
        return [
            field(texts.month, "month", select(values.month, texts.months.map((name, index) => [index + 1, name]),
                                                 value => set("month", value))),
            field(texts.monthDay, "yearly", number(values, set, "yearDay", 31))];
    case "once":
        return field(texts.date, "once", props => h("input", { type: "date", value: values.date, ...props,
                                                                 oninput: event => set("date", event.target.value) }));
    default:
        return null;
    }
}

// `errorOf` tells what is wrong with an option.
export function scheduleFields(values, set, { field, errorOf }, isPower) {
    const time = field(texts.at, "at", props =>
        h("input", { type: "time", value: values.at, ...props, oninput: event => set("at", event.target.value) }));
    if (isPower) {
        return [weekDays(values, set, errorOf("weekly")), time];
    }
    return [
        field(texts.when, "daily", select(values.kind, Object.entries(texts.kinds), kind => set("kind", kind))),
        h("div", { class: "fields-row" }, dayFields(values, set, field, errorOf)),
        h("div", { class: "fields-row" }, time,
          field(texts.every, "every", select(values.every, hours.map(hour => [hour, texts.everyHours(hour)]),
                                               value => set("every", Number(value)))),
          values.every > 0 && field(texts.until, "until", select(values.until, hours.map(hour =>
              [hour, String(hour).padStart(2, "0")]), value => set("until", value))))];
}
