// What can be done with a task, with its question and its message.

import { ask } from "./dialog.js";
import { tell, tellFailure } from "./notices.js";
import { texts } from "./texts.js";
import { change } from "./tavisched.js";

// Whether it was done. What comes of it is seen when the files change.
async function perform(args, message) {
    try {
        await change(args);
        tell(message);
        return true;
    } catch (failure) {
        tellFailure(failure);
        return false;
    }
}

export function run(task) {
    return perform(["run", task.id], texts.wasStarted(task.name));
}

export async function stop(task) {
    return await ask(texts.stopTitle, texts.stopText(task.name), texts.stop) &&
           perform(["stop", task.id], texts.wasStopped(task.name));
}

export function setEnabled(task, isOn) {
    return isOn ? perform(["enable", task.id], texts.wasEnabled(task.name))
                : perform(["disable", task.id], texts.wasDisabled(task.name));
}

export async function remove(task) {
    return await ask(texts.removeTitle, texts.removeText(task.name), texts.remove) &&
           perform(["remove", "--yes", task.id], texts.wasRemoved(task.name));
}

export async function removePower(task, what) {
    return await ask(texts.removePowerTitle, texts.removePowerText(what), texts.remove) &&
           perform(["remove", "--yes", task.id], texts.wasRemoved(task.name));
}
