// Times in words. They are the machine's: what a text with its offset says, wherever the browser is.

import { texts } from "./texts.js";

// "2026-12-24T18:00:00+01:00" as day and clock.
export function dayOf(time) {
    return time.slice(0, 10);
}

export function clockOf(time) {
    return time.slice(11, 16);
}

export function weekdayOf(time) {
    return texts.weekdays[new Date(dayOf(time) + "T00:00Z").getUTCDay()];
}

export function inWords(time) {
    return `${weekdayOf(time)} ${dayOf(time)} ${clockOf(time)}`;
}

const units = [["day", 86400], ["hour", 3600], ["minute", 60]];

const relative = new Intl.RelativeTimeFormat(cockpit.language?.replace("_", "-") || "en", { numeric: "always" });

// "in 3 hours", "5 minutes ago"
export function fromNow(time, now = Date.now()) {
    const seconds = (Date.parse(time) - now) / 1000;
    const [unit, size] = units.find(each => Math.abs(seconds) >= each[1] * 0.95) || units[units.length - 1];
    const count = Math.round(seconds / size);
    return count === 0 ? texts.now : relative.format(count, unit);
}

export function duration(seconds) {
    if (seconds < 60) {
        return texts.seconds(seconds < 10 ? Math.round(seconds * 10) / 10 : Math.round(seconds));
    }
    const minutes = Math.floor(seconds / 60);
    return minutes < 60 ? texts.minutes(minutes, Math.round(seconds % 60))
                        : texts.hours(Math.floor(minutes / 60), minutes % 60);
}
