// The only place that starts programs: the command line "tavisched", with the rights that a call needs.

import { texts } from "./texts.js";

// Has the event "changed" after every change that was made or tried here.
export const changes = new EventTarget();

// What the command line refused or failed at. `option` is the one that it is about, where there is one.
export class Refusal extends Error {
    constructor(message, option) {
        super(message);
        this.option = option || null;
    }
}

function start(args, superuser) {
    return cockpit.spawn(["tavisched", ...args.map(String)],
                         { superuser, err: "message", binary: true, environ: ["LC_ALL=C.UTF-8"] });
}

// Its errors are lines of JSON, and there may be warnings beside them.
function refusalOf(exception) {
    const message = exception.message || "";
    for (const line of message.split("\n")) {
        try {
            const told = JSON.parse(line);
            if (told.error) {
                // A field's name stands beside it already.
                return new Refusal(told.error.replace(/^--[a-z-]+: /, ""), told.option);
            }
        } catch {
            // a warning
        }
    }
    const known = { "not-found": texts.notInstalled, "access-denied": texts.noAccess,
                    "authentication-failed": texts.noAccess };
    return new Refusal(known[exception.problem] || message.replace(/^tavisched: /gm, "").trim() ||
                       texts.failed(exception.exit_status ?? exception.problem));
}

// What it writes; with a status that is among `accepted` that is an answer, too. `onText` gets the texts as they come.
function answerOf(process, { accepted = [], input, onText } = {}) {
    return new Promise((resolve, reject) => {
        const decoder = new TextDecoder(); // tasks may print anything
        let all = "";
        const take = (bytes, more) => {
            const text = decoder.decode(bytes, { stream: more });
            all += text;
            if (text && onText) {
                onText(text);
            }
        };
        process.stream(bytes => take(bytes, true));
        process.then(() => {
            take(new Uint8Array(), false);
            resolve(all);
        }, exception => {
            take(new Uint8Array(), false);
            if (accepted.includes(exception.exit_status) && all) {
                resolve(all);
            } else {
                reject(refusalOf(exception));
            }
        });
        if (input !== undefined) {
            process.input(new TextEncoder().encode(input));
        }
    });
}

// Without administrative access reading is tried all the same, so that the answer says what is missing.
export function read(args, options) {
    return answerOf(start(args, "try"), options);
}

export async function readJson(args, options) {
    return JSON.parse(await read([...args, "--json"], options));
}

export async function readLines(args, options) {
    const text = await read([...args, "--json"], options);
    return text.split("\n").filter(line => line).map(line => JSON.parse(line));
}

// A change tells the page: it need not wait for the files.
export async function change(args, options) {
    try {
        return await answerOf(start([...args, "--json"], "require"), options);
    } finally {
        changes.dispatchEvent(new Event("changed"));
    }
}

// The output of a run as it comes. The answer's `close` stops the following, not the run.
export function follow(args, onText) {
    const process = start(args, "try");
    return { ended: answerOf(process, { onText }), close: () => process.close("cancelled") };
}
