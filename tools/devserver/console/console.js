// The console page: one stream of events feeds its sections.

import { showBag } from "/console/bag.js";
import { showBooks } from "/console/books.js";
import { byId, element } from "/console/dom.js";
import { showFaults } from "/console/faults.js";
import { showFigures } from "/console/figures.js";
import { showRequests } from "/console/requests.js";
import { showUploads } from "/console/uploads.js";

const figures = showFigures();
const requests = showRequests();
const uploads = showUploads((summaries) => figures.uploads(summaries));
const sections = [showFaults(), showBag(), showBooks(), uploads];

/** The requests that the service still has, by number. */
const kept = new Map();

function endpointsKnown(names) {
  for (const id of ["requests-endpoint", "faults-endpoint"]) {
    const select = byId(id);
    const present = new Set([...select.options].map((option) => option.value));
    for (const name of names) if (!present.has(name)) select.append(element("option", { value: name }, name));
  }
}

function take({ requests: changed = [], first = 0, state }) {
  for (const request of changed) kept.set(request.number, request);
  if (first) for (const number of kept.keys()) if (number < first) kept.delete(number);
  if (first) {
    requests.changed(changed, first);
    figures.requests([...kept.values()]);
  }
  if (!state) return;
  endpointsKnown(state.status.endpoints);
  for (const section of sections) section.state(state);
}

let stream;

/** Opens the stream, whose first event has everything that the service keeps. */
function connect() {
  const connection = byId("connection");
  stream?.close();
  stream = new EventSource("/control/events");
  stream.onopen = () => {
    kept.clear();
    requests.restarted();
    connection.textContent = "live";
    connection.className = "";
  };
  stream.onmessage = (message) => take(JSON.parse(message.data));
  stream.onerror = () => {
    connection.textContent = "connection lost; trying again";
    connection.className = "lost";
    if (stream.readyState === EventSource.CLOSED) setTimeout(() => document.hidden || connect(), 3000);
  };
}

// A page that nobody sees needs no connection: the service has a thread for each, and a browser has six to a host.
document.addEventListener("visibilitychange", () => {
  if (document.hidden) stream?.close();
  else connect();
  if (document.hidden) byId("connection").textContent = "asleep in the background";
});
if (!document.hidden) connect();
