// Descriptions of elements, and the few lines that bring a part of the document in line with them. What
// did not change stays as it is, so that focus, selection and scrolling survive a refresh. Texts become
// text nodes and never markup.

const svgNamespace = "http://www.w3.org/2000/svg";
const properties = new Set(["value", "checked", "disabled", "open", "indeterminate"]);

// Children may be texts, numbers, descriptions, lists of these, or null for a place that is empty now.
export function h(tag, props, ...children) {
    return { tag, props: props || {}, key: props?.key, children: children.flat(Infinity) };
}

// The children of `parent` become what `children` describes.
export function render(parent, ...children) {
    const focused = document.activeElement;
    update(parent, children.flat(Infinity));
    if (focused !== document.activeElement && focused.isConnected) {
        focused.focus({ preventScroll: true });
    }
}

function isEmpty(child) {
    return child === null || child === undefined || child === false;
}

function fits(node, child) {
    if (!node) {
        return false;
    }
    return child.tag === undefined
        ? node.nodeType === Node.TEXT_NODE
        : node.tag === child.tag && node.key === child.key;
}

function create(parent, child) {
    if (child.tag === undefined) {
        return document.createTextNode("");
    }
    const isSvg = child.tag === "svg" || parent.namespaceURI === svgNamespace;
    const node = isSvg ? document.createElementNS(svgNamespace, child.tag) : document.createElement(child.tag);
    node.tag = child.tag;
    node.key = child.key;
    return node;
}

function update(parent, children) {
    const wanted = new Set(children.map(child => child?.key));
    const keyed = new Map();
    for (const node of [...parent.childNodes]) {
        if (node.key !== undefined) {
            if (wanted.has(node.key)) {
                keyed.set(node.key, node);
            } else {
                node.remove(); // before the others are placed, so that these need not move
            }
        }
    }
    let place = parent.firstChild;
    for (const child of children) {
        const what = isEmpty(child) ? "" : child;
        const known = what.key === undefined ? place : keyed.get(what.key);
        const node = fits(known, what) ? known : create(parent, what);
        if (node === place) {
            place = place.nextSibling;
        } else if (place && what.key === undefined && place.key === undefined) {
            const next = place.nextSibling;
            place.replaceWith(node); // those that follow keep their places
            place = next;
        } else {
            parent.insertBefore(node, place);
        }
        fill(node, what);
    }
    while (place) {
        const next = place.nextSibling;
        place.remove();
        place = next;
    }
}

function fill(node, child) {
    if (child.tag === undefined) {
        const text = String(child);
        if (node.data !== text) {
            node.data = text;
        }
        return;
    }
    const before = node.props || {};
    node.props = child.props;
    for (const name of Object.keys(before)) {
        if (!(name in child.props)) {
            set(node, name, null, before[name]);
        }
    }
    update(node, child.children); // the value of a selection needs its options
    for (const [name, value] of Object.entries(child.props)) {
        set(node, name, value, before[name]);
    }
    if (child.props.made && !before.made) {
        child.props.made(node);
    }
}

function set(node, name, value, before) {
    if (name === "key" || name === "made") {
        return;
    }
    if (name.startsWith("on")) {
        node[name] = value;
    } else if (properties.has(name)) {
        // Also what the user changed meanwhile becomes what is described.
        if (value !== before || node[name] !== value) {
            node[name] = value ?? "";
        }
    } else if (value === before) {
        return;
    } else if (value === null || value === undefined || value === false) {
        node.removeAttribute(name);
    } else {
        node.setAttribute(name, value === true ? "" : value);
    }
}
