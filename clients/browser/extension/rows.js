// What the address field shows for an answer of the native host. Pure functions.

const MAXIMUM_ROWS = 8;

/** Returns the text without what a list of rows, or an XML document, can't contain: one such row would hide all. */
export function printable(text) {
  return text.toWellFormed().replace(/[\p{Cc}\p{Zl}\p{Zp}\ufffe\uffff]+/gu, " ").trim();
}

export function escapeXml(text) {
  const entities = { "&": "&amp;", "<": "&lt;", ">": "&gt;", '"': "&quot;", "'": "&apos;" };
  return text.replace(/[&<>"']/g, (character) => entities[character]);
}

/** Returns XML of the text with the words of `typed` marked where a word begins with them. */
function marked(text, typed) {
  const words = typed.split(/\s+/u).filter(Boolean).map((word) => word.replace(/[\\^$.*+?()[\]{}|]/g, "\\$&"));
  if (words.length === 0) return escapeXml(text);
  const parts = text.split(new RegExp(`(?<![\\p{L}\\p{N}])(${words.join("|")})`, "giu"));
  return parts.map((part, index) => (index % 2 ? `<match>${escapeXml(part)}</match>` : escapeXml(part))).join("");
}

/** Returns whether `text` is the address of a web page. */
export function isWebAddress(text) {
  return /^https?:\/\//i.test(text) && URL.canParse(text);
}

/**
 * Returns the rows for an answer: what the address field gets if one is chosen (`content`), its description, and
 * which result or suggestion it is. Descriptions are XML if `inXml` is set (Chromium), else plain text (Firefox).
 * Results come first. Rows with the same content, or that of the typed text itself, are left out.
 */
export function rowsOf(answer, typed, inXml) {
  const rows = new Map();
  const add = (content, title, more, chosen) => {
    if (rows.size === MAXIMUM_ROWS || rows.has(content) || content === typed || !title) return;
    const description = inXml
      ? marked(title, typed) + (more ? ` <dim>${escapeXml(more)}</dim>` : "")
      : title + (more ? ` – ${more}` : "");
    rows.set(content, { content, description, ...chosen });
  };
  for (const { id, title, description, url } of answer.results)
    if (isWebAddress(url)) add(url, printable(title), printable(description), { result: id });
  for (const { id, text } of answer.suggestions) add(printable(text), printable(text), "", { suggestion: id });
  return [...rows.values()];
}
