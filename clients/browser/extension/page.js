// Says whether the daemon can be reached, and tries a search as the address field makes it.
const api = globalThis.browser ?? globalThis.chrome;
const status = document.getElementById("status");
const text = document.getElementById("text");
const rows = document.getElementById("rows");

function say(message, isProblem) {
  status.textContent = message;
  status.classList.toggle("problem", isProblem);
}

/** Returns the background program's answer; nothing, after it was said, if there is a problem. */
async function ask(message) {
  const answer = await api.runtime.sendMessage(message);
  if (answer?.problem) say(answer.problem, true);
  return answer?.problem ? null : answer;
}

text.addEventListener("input", async () => {
  const found = await ask({ do: "search", text: text.value });
  if (!found) return;
  if (found.rows.length > 0) say("The search daemon answers.", false);
  rows.replaceChildren(...found.rows.map(({ description }) => {
    const row = document.createElement("li");
    row.textContent = description;
    return row;
  }));
});

const found = await ask({ do: "status" });
if (found) say(found.enabled ? "The search daemon answers." : "The search service has switched search off.", !found.enabled);
