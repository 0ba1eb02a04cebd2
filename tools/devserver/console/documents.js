// Explains names with the tables of the project's documents, which the service holds beside this page.

const cells = (row) => row.split("|").slice(1, -1).map((cell) => cell.trim());
const plain = (text) => text.replace(/\[([^\]]*)\]\([^)]*\)/g, "$1").replaceAll("`", "");

async function sectionOf(page, heading) {
  const reply = await fetch(`/console/${page}.md`);
  const text = reply.ok ? await reply.text() : "";
  const begin = text.indexOf(`\n## ${heading}\n`);
  const end = text.indexOf("\n## ", begin + 1);
  return begin < 0 ? "" : text.slice(begin, end < 0 ? undefined : end);
}

/** Returns the rows of the first table of a section: {names, cells}, where names are the code texts of the first cell. */
async function tableOf(page, heading) {
  const table = (await sectionOf(page, heading)).match(/(^\|.*\n)+/m)?.[0] ?? "";
  return table.trim().split("\n").slice(2).map((row) => {
    const [first, ...rest] = cells(row);
    return { names: [...first.matchAll(/`([^`]+)`/g)].map((match) => match[1]), cells: rest.map(plain) };
  });
}

// What the documents' tables don't have: the items that a kind of request forces, and HTTP's own header fields.
const others = {
  "q": "what the user typed or selected",
  "qtype": "zkw: a zero-keyword request, before anything is typed; suggested: the user tapped a suggestion",
  "id": "the identifier of the result",
  "section": "the section of which more results are wanted",
  "offset": "the number of results that the client has already",
  "size": "bytes to which the image is padded",
  "accept": "content types that the client reads",
  "accept-encoding": "content codings that the client can undo",
  "accept-language": "languages that the client prefers",
  "cache-control": "what caches on the way may do",
  "connection": "whether the connection stays open",
  "content-encoding": "coding of the body; uploads are raw DEFLATE",
  "content-length": "bytes of the body",
  "content-type": "type of the body",
  "expect": "waits for a go-ahead before it sends the body",
  "host": "host and port of this service as the client knows it",
  "if-modified-since": "asks for the body only if it is newer",
  "range": "asks for a part of the body",
  "transfer-encoding": "how the body is framed",
};

/** Returns a function that explains a query item or header; it returns null for one that nothing explains. */
export async function requestItems() {
  const known = new Map(Object.entries(others));
  for (const { names, cells: [, text] } of await tableOf("requests", "Items and headers"))
    for (const name of names) known.set(name.split("=")[0].toLowerCase(), text);
  return (name) => known.get(name.toLowerCase()) ?? null;
}

/** Returns [{name, unit, text}] of the faults; the unit is empty if the fault has no number. */
export async function faultKinds() {
  return (await tableOf("devserver", "Faults")).flatMap(({ names, cells: [text] }) => names.map((name) => {
    const [kind, unit = ""] = name.split(":");
    return { name: kind, unit, text };
  }));
}

/** Returns [name, type and default, effect] of the bag's keys. */
export async function bagKeys() {
  return (await tableOf("bag", "Keys")).map(({ names, cells: [type, missing, effect] }) =>
    [names.join(", "), effect, `${type}; if missing: ${missing}`]);
}

/** Returns the first paragraph about each type of event, by type. */
export async function eventTypes() {
  const texts = new Map();
  for (const part of (await sectionOf("feedback", "Events")).split("\n### ").slice(1)) {
    const [type, ...rest] = part.split("\n\n");
    texts.set(type.trim(), rest[0]?.startsWith("```") ? "" : plain(rest[0] ?? "").replaceAll("\n", " "));
  }
  return texts;
}
