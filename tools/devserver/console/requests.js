// The live list of requests, newest first.

import { byId, clock, element, explained, milliseconds } from "/console/dom.js";
import { requestItems } from "/console/documents.js";

const kMostRows = 300;

function decoded(text) {
  try {
    return decodeURIComponent(text.replaceAll("+", " "));
  } catch {
    return text; // not UTF-8
  }
}

const itemsOf = (query) => query.split("&").filter(Boolean).map((item) => {
  const equals = item.indexOf("=");
  return equals < 0 ? [decoded(item), ""] : [decoded(item.slice(0, equals)), decoded(item.slice(equals + 1))];
});

function stateOf({ status }) {
  if (status === null) return ["waits", "held"];
  if (status === 499) return ["bad", "gone"];
  return [status < 400 ? "good" : "bad", String(status)];
}

export function showRequests() {
  const list = byId("requests-list");
  const endpoint = byId("requests-endpoint");
  const text = byId("requests-text");
  const pause = byId("requests-pause");
  const rows = new Map(); // number → {request, item, summary, body}
  const waiting = new Map(); // what came during a pause
  let explain = () => null;

  function matches({ request }) {
    const wanted = text.value.toLowerCase();
    return (!endpoint.value || request.endpoint === endpoint.value) &&
      (!wanted || decoded(`${request.path}?${request.query}`).toLowerCase().includes(wanted));
  }

  function filter() {
    for (const row of rows.values()) row.item.hidden = !matches(row);
  }

  function summarise({ request, summary }) {
    const typed = itemsOf(request.query).find(([name]) => name === "q");
    const [kind, state] = stateOf(request);
    summary.replaceChildren(
      element("time", {}, clock(request.time)),
      element("span", { class: "kind" }, request.endpoint),
      element("span", { class: "target" }, `${request.method} ${request.path}${typed ? ` “${typed[1]}”` : ""}`),
      element("span", { class: `state ${kind}` }, state),
      element("span", { class: "duration" }, request.duration === null ? "…" : `${milliseconds(request.duration)} ms`));
  }

  function fill({ request, body }) {
    const rowsOf = (entries) => explained(entries.map(([name, value]) =>
      [name, value, explain(name) ?? "not in the documents"]));
    const items = itemsOf(request.query);
    const facts = [["number", String(request.number)], ["URL", `${request.secure ? "https" : "http"}, ${request.path}${request.query ? "?" : ""}${request.query}`]];
    if (request.status !== null) facts.push(["answer", `${request.status}, ${request.size} bytes after ${milliseconds(request.duration)} ms`]);
    if (request.faults) facts.push(["faults", request.faults]);
    body.replaceChildren(
      element("dl", { class: "explained" }, ...explained(facts)),
      element("h3", {}, "Query items"),
      items.length ? element("dl", { class: "explained" }, ...rowsOf(items)) : element("p", { class: "hint" }, "none"),
      element("h3", {}, "Headers"),
      element("dl", { class: "explained" }, ...rowsOf(Object.entries(request.headers))));
  }

  function add(request) {
    const summary = element("summary");
    const body = element("div", { class: "inside" });
    const details = element("details", {}, summary, body);
    const row = { request, summary, body, details, item: element("li", {}, details) };
    details.addEventListener("toggle", () => details.open && fill(row));
    row.item.hidden = !matches(row);
    rows.set(request.number, row);
    list.prepend(row.item);
    return row;
  }

  function show(request) {
    const row = rows.get(request.number);
    if (row) row.request = request;
    summarise(row ?? add(request));
    if (row?.details.open) fill(row);
  }

  function removeBefore(first) {
    for (const [number, row] of rows) {
      if (number >= first && rows.size <= kMostRows) break;
      row.item.remove();
      rows.delete(number);
    }
    byId("requests-none").hidden = rows.size > 0;
  }

  let first = 0;
  function flush() {
    for (const request of waiting.values()) show(request);
    waiting.clear();
    removeBefore(first);
  }

  endpoint.addEventListener("change", filter);
  text.addEventListener("input", filter);
  pause.addEventListener("click", () => {
    const paused = pause.getAttribute("aria-pressed") !== "true";
    pause.setAttribute("aria-pressed", paused);
    if (!paused) flush();
  });
  requestItems().then((known) => {
    explain = known;
    for (const row of rows.values()) if (row.details.open) fill(row);
  });

  return {
    changed(requests, oldest) {
      for (const request of requests) waiting.set(request.number, request);
      first = oldest;
      if (pause.getAttribute("aria-pressed") !== "true") flush();
    },
    /** The service or the connection began again: what follows is everything. */
    restarted() {
      waiting.clear();
      removeBefore(Infinity);
    },
  };
}
