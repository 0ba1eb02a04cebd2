// The address field: every key is a search, the newest answer is shown, and what the user chooses is opened.
import { Host } from "./host.js";
import { escapeXml, isWebAddress, printable, rowsOf } from "./rows.js";

const api = globalThis.browser ?? globalThis.chrome;
const inXml = !api.runtime.getURL("").startsWith("moz-extension:");
const host = new Host(api.runtime);
let newest = 0; // number of the last input
let leaving = 0; // timer
let shown = { query: 0, rows: [] };

/** Sets what the address field shows for the typed text itself, from the next key on. */
function describe(problem) {
  const usual = inXml ? "Search the web for <match>%s</match>" : "Search the web";
  const text = problem && printable(problem);
  api.omnibox.setDefaultSuggestion({ description: !problem ? usual : inXml ? escapeXml(text) : text });
}

/** Returns the rows for a text; nothing if a later input overtook it. Rejects with what to tell the user. */
async function search(text, inXml) {
  const number = ++newest;
  const answer = await host.ask({ do: "search", text }).catch((problem) => {
    if (number === newest) throw problem;
  });
  if (number !== newest || !answer) return null;
  return { query: answer.query, rows: rowsOf(answer, text, inXml) };
}

async function open(url, disposition) {
  if (disposition === "currentTab") await api.tabs.update({ url });
  else await api.tabs.create({ url, active: disposition !== "newBackgroundTab" });
}

/** Opens the browser's own search engine. */
async function openSearch(text, disposition) {
  if (disposition === "newBackgroundTab") {
    const tab = await api.tabs.create({ active: false });
    await api.search.query({ text, tabId: tab.id });
  } else {
    await api.search.query({ text, disposition: disposition === "currentTab" ? "CURRENT_TAB" : "NEW_TAB" });
  }
}

/** Reports that the user has left the address field, if that is still to be reported. */
function leave() {
  if (leaving) host.tell({ do: "ended", how: "cancelled" });
  stay();
}

function stay() {
  clearTimeout(leaving);
  leaving = 0;
}

api.omnibox.onInputStarted.addListener(() => {
  leave();
  shown = { query: 0, rows: [] };
  describe();
  host.tell({ do: "started" });
});

api.omnibox.onInputChanged.addListener(async (text, suggest) => {
  try {
    const found = await search(text, inXml);
    if (!found) return;
    describe();
    shown = found;
    suggest(found.rows.map(({ content, description }) => ({ content, description })));
    const named = (kind) => found.rows.map((row) => row[kind]).filter(Boolean);
    if (found.rows.length > 0)
      host.tell({ do: "shown", query: found.query, results: named("result"), suggestions: named("suggestion") });
  } catch (problem) {
    suggest([]);
    describe(problem.message);
  }
});

api.omnibox.onInputEntered.addListener(async (text, disposition) => {
  ++newest; // what is still searched for is no longer shown
  stay();
  const row = shown.rows.find(({ content }) => content === text);
  if (row) host.tell({ do: "opened", query: shown.query, result: row.result, suggestion: row.suggestion });
  host.tell({ do: "ended", how: isWebAddress(text) ? "opened" : "searched" });
  // A text that is an address is opened even if the browser has stopped this program since it was shown.
  await (isWebAddress(text) ? open(text, disposition) : openSearch(text, disposition));
});

// Chromium also says that the input was cancelled just before it was entered.
api.omnibox.onInputCancelled.addListener(() => {
  ++newest;
  stay();
  leaving = setTimeout(leave, 500);
});

// The extension's page.
api.runtime.onMessage.addListener((message, sender, reply) => {
  const answered = message.do === "status" ? host.ask({ do: "status" }) : search(String(message.text), false);
  answered.then(reply, (problem) => reply({ problem: problem.message }));
  return true;
});
