// What was received, counted and refused, and the service's other settings.

import { post } from "/console/control.js";
import { byId, element, perform } from "/console/dom.js";

export function showBooks() {
  const said = byId("books-said");
  const age = byId("books-age-value");

  byId("books-age").addEventListener("submit", (event) => {
    event.preventDefault();
    perform(said, () => post("search", { max_age: Number(age.value) }), `sets are fresh for ${age.value} s`);
  });
  byId("books-resources").addEventListener("click", () => perform(said, () => post("resources/bump"), "a new bag will list them"));
  byId("books-reset").addEventListener("click", () => {
    if (confirm("Removes faults, changes of the bag, the log and all uploads. Continue?")) perform(said, () => post("reset"), "reset");
  });

  return {
    state({ status }) {
      const { uploads } = status;
      const rows = [
        ["requests", status.requests], ...Object.entries(status.by_endpoint).map(([name, count]) => [`… ${name}`, count]),
        ["uploads received", uploads.received], ["… taken", uploads.taken], ["… refused", uploads.refused],
        ["… repeats", uploads.repeats], ["events in taken uploads", uploads.events],
        ["version of the bag", status.bag_version], ["entries of the catalogue", status.catalogue],
      ];
      byId("books-table").tBodies[0].replaceChildren(...rows.map(([name, value]) =>
        element("tr", {}, element("th", { scope: "row" }, name), element("td", {}, String(value)))));
      if (document.activeElement !== age) age.value = status.max_age;
    },
  };
}
