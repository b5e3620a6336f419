// Small helpers to build and to change the page. Text is only ever text here: nothing is parsed as markup, so
// that an application may have any name.

const SVG = "http://www.w3.org/2000/svg";

// An element with these attributes and children (strings become text; what is null is left out).
export function element(tag, attributes = {}, ...children) {
  return filled(document.createElement(tag), attributes, children);
}

export function shape(tag, attributes = {}, ...children) {
  return filled(document.createElementNS(SVG, tag), attributes, children);
}

function filled(node, attributes, children) {
  for (const [name, value] of Object.entries(attributes)) setAttribute(node, name, value);
  node.append(...children.filter((child) => child !== null && child !== undefined));
  return node;
}

export function setAttribute(node, name, value) {
  if (value === null || value === undefined || value === false) {
    node.removeAttribute(name);
  } else if (node.getAttribute(name) !== String(value)) {
    node.setAttribute(name, value === true ? "" : value);
  }
}

export function setText(node, text) {
  if (node.textContent !== text) node.textContent = text;
}

export function show(node, isShown) {
  if (node.hidden === isShown) node.hidden = !isShown;
}

export const byId = (id) => document.getElementById(id);

// Makes the children of `parent` these nodes in this order, and touches only those that stand elsewhere.
export function arrange(parent, nodes) {
  const wanted = new Set(nodes);
  for (const child of [...parent.children]) {
    if (!wanted.has(child)) child.remove();
  }
  if (!parent.firstChild) {
    parent.append(...nodes);
    return;
  }
  let place = parent.firstChild;
  for (const node of nodes) {
    if (node === place) {
      place = place.nextSibling;
    } else {
      parent.insertBefore(node, place);
    }
  }
}
