// The bag to edit. The daemon's own code names its problems; a bag with problems can be applied, to see what clients make of it.

import { get, post } from "/console/control.js";
import { byId, element, explained, perform, say, settled } from "/console/dom.js";
import { bagKeys } from "/console/documents.js";

export function showBag() {
  const [text, problems, said, apply] = ["bag-text", "bag-problems", "bag-said", "bag-apply"].map(byId);
  let loaded = {}; // the bag that the text was made of
  let lastChanges;
  const textOf = (bag) => JSON.stringify(bag, null, 2);
  const edited = () => text.value !== textOf(loaded);

  function show(found, isJson = true) {
    problems.replaceChildren(...found.map((problem) => element("li", {}, problem)));
    text.setAttribute("aria-invalid", found.length > 0);
    apply.disabled = !isJson;
    apply.textContent = isJson && found.length ? "Apply in spite of problems" : "Apply";
  }

  async function check() {
    const checked = text.value;
    try {
      const answer = await post("bag/check", checked);
      if (checked === text.value) show(answer.problems);
    } catch (error) {
      if (checked === text.value) show([error.message], false);
    }
  }

  const load = (words = "") => perform(said, async () => {
    const answer = await get("bag");
    loaded = answer.bag;
    text.value = textOf(loaded);
    show(answer.problems);
  }, words);

  /** What differs from the loaded bag; null removes a key. */
  function differences(bag) {
    const changed = {};
    for (const key of Object.keys(loaded)) if (!(key in bag)) changed[key] = null;
    for (const [key, value] of Object.entries(bag)) if (JSON.stringify(value) !== JSON.stringify(loaded[key])) changed[key] = value;
    return changed;
  }

  text.addEventListener("input", settled(check, 300));
  apply.addEventListener("click", () => perform(said, async () => {
    const changed = differences(JSON.parse(text.value));
    await post("bag", changed);
    await load(`applied: ${Object.keys(changed).join(", ") || "no change"}`);
  }));
  byId("bag-revert").addEventListener("click", () => load());
  byId("bag-bump").addEventListener("click", () => perform(said, async () => {
    const { version } = await post("bag/bump");
    await load(`version ${version}: the next search announces it`);
  }));
  bagKeys().then((keys) => byId("bag-keys").append(...explained(keys)));

  return {
    state({ bag_changes: changes }) {
      if (changes === lastChanges) return;
      lastChanges = changes;
      if (edited() && text.value) say(said, "the bag changed meanwhile; Apply sends only what you changed, Revert shows it");
      else load(said.textContent);
    },
  };
}
