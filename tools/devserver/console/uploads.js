// The uploads, and one of them event by event on a time line.

import { get } from "/console/control.js";
import { byId, element, explained, tree } from "/console/dom.js";
import { eventTypes } from "/console/documents.js";

const kEventsAtOnce = 200;
const kMostMarks = 2000;
const kWidth = 1000;

const seconds = (ms) => `+${(ms / 1000).toFixed(3)} s`;

/** What says most about an event, in a few words. */
function gist(event) {
  if (typeof event.input === "string") return `“${event.input}”`;
  for (const key of ["results", "suggestions", "sections"])
    if (Array.isArray(event[key])) return `${event[key].length} ${key}`;
  return String(event.reason ?? event.trigger_event ?? event.status_code ?? event.endpoint_type ?? event.error?.reason ?? "");
}

function shape(name, attributes, ...children) {
  const made = document.createElementNS("http://www.w3.org/2000/svg", name);
  for (const [key, value] of Object.entries(attributes)) made.setAttribute(key, value);
  made.append(...children);
  return made;
}

/** A strip with a mark for each event; the list below it has the same for the keyboard and for readers of screens. */
function timeLine(events, open) {
  const length = Math.max(events.at(-1).timestamp, 1);
  const line = shape("svg", { class: "line", viewBox: `0 0 ${kWidth} 50`, preserveAspectRatio: "none", "aria-hidden": "true" },
    shape("line", { class: "axis", x1: 0, x2: kWidth, y1: 40, y2: 40 }));
  events.slice(0, kMostMarks).forEach((event, index) => {
    const mark = shape("rect", { class: "mark", x: 6 + (kWidth - 16) * event.timestamp / length, y: 8 + index % 4 * 5, width: 5, height: 30 - index % 4 * 5 },
      shape("title", {}, `${seconds(event.timestamp)} ${event.type}`));
    mark.addEventListener("click", () => open(index));
    line.append(mark);
  });
  return line;
}

export function showUploads(onSummaries) {
  const [list, detail] = ["uploads-list", "upload"].map(byId);
  let shownNumber = null;
  let lastTotals = "";
  let types = new Map();
  eventTypes().then((known) => {
    types = known;
  });

  function sessionParts(session) {
    const events = session.fb;
    const items = element("ol", { class: "events", "aria-label": "Events" });
    const more = element("button", { type: "button" }, "Show more events");
    const add = (until) => {
      for (let index = items.childElementCount; index < Math.min(until, events.length); ++index) items.append(eventRow(events[index], index));
      more.hidden = items.childElementCount === events.length;
    };
    more.addEventListener("click", () => add(items.childElementCount + kEventsAtOnce));
    add(kEventsAtOnce);
    if (events.length === 0) return [items];
    const open = (index) => {
      add(index + 1);
      const details = items.children[index].firstChild;
      details.open = true;
      details.firstChild.focus();
    };
    const ends = element("div", { class: "ends" }, element("span", {}, session.base_time ? new Date(session.base_time * 1000).toLocaleString() : "start"),
      element("span", {}, seconds(events.at(-1).timestamp)));
    return [timeLine(events, open), ends, items, more];
  }

  function eventRow(event, index) {
    const { type, timestamp, ...fields } = event;
    const summary = element("summary", {}, element("time", {}, seconds(timestamp)), element("span", { class: "kind" }, type),
      element("span", {}, gist(event)));
    const details = element("details", {}, summary);
    details.addEventListener("toggle", () => {
      if (details.childElementCount > 1) return;
      const why = types.get(type);
      details.append(element("div", { class: "inside" }, ...(why ? [element("p", { class: "hint" }, why)] : []), tree(fields)));
    });
    return element("li", { "data-index": index }, details);
  }

  function factsOf(upload) {
    const { fb, ...session } = upload.json ?? {};
    const facts = [
      ["answer", `${upload.status}${upload.cut ? ", cut" : ""}${upload.error ? `: ${upload.error}` : ""}`],
      ["address", upload.path + (upload.query ? `?${upload.query}` : "")],
      ["size", `${upload.size} bytes, sent as ${upload.packed_size}`],
      ["digest", upload.digest_ok ? "right" : upload.digest ? "wrong" : "missing"],
      ["repeat", upload.repeat ? `the same was received ${upload.repeat} times before` : "no"],
    ];
    for (const [key, value] of Object.entries(session)) facts.push([key, typeof value === "string" ? value : tree(value)]);
    return facts;
  }

  async function open(number) {
    shownNumber = number;
    for (const button of list.querySelectorAll("button")) button.setAttribute("aria-pressed", Number(button.dataset.number) === number);
    try {
      const upload = await get(`uploads?number=${number}`);
      if (shownNumber !== number) return;
      const isSession = !upload.error && Array.isArray(upload.json?.fb);
      detail.replaceChildren(element("h3", {}, `Upload ${number}`), element("dl", { class: "explained" }, ...explained(factsOf(upload))),
        ...(isSession ? sessionParts(upload.json) : [tree(upload.json?.fb ?? null)]));
      detail.focus();
    } catch (error) {
      detail.replaceChildren(element("p", { class: "failed" }, error.message));
    }
  }

  function summaryRow(upload) {
    return element("li", {}, element("button", { type: "button", "data-number": upload.number, "aria-pressed": upload.number === shownNumber,
      onclick: () => open(upload.number) },
      element("span", { class: "number" }, `#${upload.number}`), element("span", { class: "kind" }, upload.agent ?? upload.path),
      element("span", {}, `${upload.events} events, ${upload.size} bytes`),
      element("span", { class: upload.status === 200 && !upload.cut ? "good" : "bad" },
        `${upload.status}${upload.cut ? ", cut" : ""}${upload.repeat ? ", again" : ""}${upload.error ? ": refused" : ""}`)));
  }

  async function load() {
    const summaries = await get("uploads?json=0").catch(() => null);
    if (!summaries) return;
    const focused = list.contains(document.activeElement) ? document.activeElement.dataset.number : null;
    list.replaceChildren(...summaries.toReversed().map(summaryRow));
    if (focused) list.querySelector(`[data-number="${focused}"]`)?.focus();
    byId("uploads-none").hidden = summaries.length > 0;
    onSummaries(summaries);
  }

  return {
    state({ status }) {
      const totals = JSON.stringify(status.uploads);
      if (totals !== lastTotals) load();
      lastTotals = totals;
    },
  };
}
