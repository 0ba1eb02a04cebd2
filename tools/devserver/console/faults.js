// Switches faults of the service.

import { post } from "/console/control.js";
import { byId, element, perform } from "/console/dom.js";
import { faultKinds } from "/console/documents.js";

/** A number to begin with for each unit. */
const kNumbers = { MS: 400, CODE: 503, BYTES: 1_000_000, DEPTH: 1000, SECONDS: 60 };

export function showFaults() {
  const [kind, text, said] = ["faults-kind", "faults-text", "faults-said"].map(byId);
  let kinds = [];

  function chosen() {
    const fault = kinds.find(({ name }) => name === kind.value);
    text.value = fault.unit ? `${fault.name}:${kNumbers[fault.unit] ?? 1}` : fault.name;
    byId("faults-explained").textContent = `The service ${fault.text}.`;
  }

  kind.addEventListener("change", chosen);
  byId("faults-form").addEventListener("submit", async (event) => {
    event.preventDefault();
    const fault = { endpoint: byId("faults-endpoint").value, fault: text.value, count: Number(byId("faults-count").value) };
    text.setAttribute("aria-invalid", !await perform(said, () => post("faults", fault), `${fault.fault} is on`));
  });
  byId("faults-clear").addEventListener("click", () => perform(said, () => post("faults/clear"), "all faults are off"));
  byId("faults-release").addEventListener("click", () => perform(said, () => post("release"), "held requests were released"));
  faultKinds().then((known) => {
    kinds = known;
    kind.replaceChildren(...kinds.map(({ name }) => element("option", { value: name }, name)));
    chosen();
  });

  return {
    state({ faults }) {
      const rows = faults.map(({ endpoint, fault, left }) =>
        element("li", {}, element("code", {}, fault), ` for ${endpoint === "*" ? "all" : endpoint}, `,
          left === 0 ? "until it is switched off" : `${left} requests left`));
      byId("faults-list").replaceChildren(...(rows.length ? rows : [element("li", { class: "hint" }, "none")]));
    },
  };
}
