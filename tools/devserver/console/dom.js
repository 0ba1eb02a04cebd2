// Builds and finds elements. Texts become text nodes: nothing that a request contains is read as HTML.

export const byId = (id) => document.getElementById(id);

/** Returns an element. `attributes` with names that begin with "on" are listeners; null and false leave one out. */
export function element(tag, attributes = {}, ...children) {
  const made = document.createElement(tag);
  for (const [name, value] of Object.entries(attributes)) {
    if (name.startsWith("on")) made.addEventListener(name.slice(2), value);
    else if (value !== null && value !== false) made.setAttribute(name, value);
  }
  made.append(...children);
  return made;
}

/** Returns rows of a description list: [name, value, explanation]. */
export function explained(rows) {
  return rows.flatMap(([name, value, why]) => [
    element("dt", {}, name),
    element("dd", {}, value, ...(why ? [element("span", { class: "why" }, why)] : [])),
  ]);
}

/** Shows any JSON value as a tree; what is deeper than 12 levels is text. */
export function tree(value, depth = 0) {
  if (value === null || typeof value !== "object" || depth > 12) return element("code", {}, JSON.stringify(value));
  const entries = Object.entries(value);
  if (entries.length === 0) return element("code", {}, Array.isArray(value) ? "[]" : "{}");
  return element("div", { class: "tree" }, ...entries.map(([name, each]) =>
    element("div", {}, element("span", { class: "name" }, `${name}: `), tree(each, depth + 1))));
}

/** Says in a status line what became of an action. */
export function say(line, text, failed = false) {
  line.textContent = text;
  line.classList.toggle("failed", failed);
}

/** Does some work; says `done` in a status line if there is such a text, or the error. Returns whether the work succeeded. */
export async function perform(line, work, done) {
  try {
    await work();
    if (done !== undefined) say(line, done);
    return true;
  } catch (error) {
    say(line, error.message, true);
    return false;
  }
}

export const clock = (seconds) => new Date(seconds * 1000).toTimeString().slice(0, 8);
export const milliseconds = (value) => (value < 10 ? value.toFixed(2) : value < 1000 ? value.toFixed(0) : `${(value / 1000).toFixed(1)}k`);

/** Calls `run` once after a quiet time of `delay` ms. */
export function settled(run, delay) {
  let timer;
  return () => {
    clearTimeout(timer);
    timer = setTimeout(run, delay);
  };
}
