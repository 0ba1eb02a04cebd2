// Latencies and cache hits: tables always, charts if the library is installed.

import { byId, clock, element, milliseconds } from "/console/dom.js";

const kShapes = ["circle", "triangle", "rect", "rectRot", "cross", "star", "crossRot", "dash", "line", "rectRounded", "circle", "triangle"];

function quantile(sorted, part) {
  return sorted[Math.min(sorted.length - 1, Math.floor(sorted.length * part))];
}

function row(name, values, counts) {
  const sorted = values.toSorted((a, b) => a - b);
  const times = sorted.length ? [quantile(sorted, 0.5), quantile(sorted, 0.99), sorted.at(-1)].map(milliseconds) : ["–", "–", "–"];
  return element("tr", {}, element("th", { scope: "row" }, name),
    ...[sorted.length, ...times, ...counts].map((value) => element("td", {}, String(value))));
}

const colour = (name) => getComputedStyle(document.documentElement).getPropertyValue(name).trim();
const hue = (index, dark) => `hsl(${(index * 137 + 210) % 360} 65% ${dark ? 70 : 38}%)`;

function axes(x, y) {
  const scale = (options) => ({ ...options, ticks: { color: colour("--dim"), ...options.ticks }, grid: { color: colour("--line") },
    title: { display: true, color: colour("--dim"), ...options.title } });
  return { animation: false, maintainAspectRatio: false, scales: { x: scale(x), y: scale(y) },
    plugins: { legend: { labels: { color: colour("--text"), usePointStyle: true } } } };
}

export function showFigures() {
  const Chart = globalThis.Chart;
  const darkness = matchMedia("(prefers-color-scheme: dark)");
  let latest = [];
  let uploads = [];
  let latencyChart, hitsChart, timer;

  byId("figures-missing").hidden = Boolean(Chart);
  for (const chart of document.querySelectorAll("#figures .chart")) chart.hidden = !Chart;

  const endpoints = () => [...new Set(latest.map((request) => request.endpoint))].sort();

  function drawTable() {
    const rows = endpoints().map((endpoint) => {
      const requests = latest.filter((request) => request.endpoint === endpoint);
      const answered = requests.filter((request) => request.status !== null && request.status !== 499);
      const count = (holds) => requests.filter(holds).length;
      return row(endpoint, answered.map((request) => request.duration), [count((request) => request.status === 304),
        count((request) => request.status >= 400), count((request) => request.status === null)]);
    });
    const seen = uploads.flatMap((upload) => upload.searches.latencies);
    if (seen.length) rows.push(row("uploads say", seen, ["", "", ""]));
    byId("latency-table").tBodies[0].replaceChildren(...rows);
  }

  function drawHits() {
    const sessions = uploads.filter((upload) => upload.searches.sent + upload.searches.from_memory > 0);
    const sum = (key) => sessions.reduce((total, upload) => total + upload.searches[key], 0);
    const [sent, memory] = [sum("sent"), sum("from_memory")];
    if (sent + memory > 0)
      byId("hits").textContent = `Of ${sent + memory} searches in ${sessions.length} uploads, devices answered ${memory} ` +
        `(${Math.round(100 * memory / (sent + memory))} %) from memory and sent ${sent}.`;
    return sessions;
  }

  function draw() {
    timer = undefined;
    drawTable();
    const sessions = drawHits();
    if (!Chart) return;
    byId("hits-chart").parentElement.hidden = sessions.length === 0;
    const latency = {
      datasets: endpoints().map((label, index) => ({
        label, pointStyle: kShapes[index], borderColor: hue(index, darkness.matches), backgroundColor: hue(index, darkness.matches),
        data: latest.filter((request) => request.endpoint === label && request.duration !== null)
          .map((request) => ({ x: request.time, y: Math.max(request.duration, 0.01) })),
      })),
    };
    const hits = {
      labels: sessions.map((upload) => `#${upload.number}`),
      datasets: [["from memory", "from_memory", "--good"], ["sent", "sent", "--accent"]].map(([label, key, name]) =>
        ({ label, data: sessions.map((upload) => upload.searches[key]), backgroundColor: colour(name) })),
    };
    const latencyOptions = axes({ type: "linear", ticks: { callback: clock, maxTicksLimit: 6 }, title: { text: "time" } },
      { type: "logarithmic", title: { text: "milliseconds" } });
    const hitsOptions = axes({ stacked: true, title: { text: "upload" } }, { stacked: true, ticks: { precision: 0 }, title: { text: "searches" } });
    latencyChart ??= new Chart(byId("latency-chart"), { type: "scatter", data: latency, options: latencyOptions });
    hitsChart ??= new Chart(byId("hits-chart"), { type: "bar", data: hits, options: hitsOptions });
    Object.assign(latencyChart, { data: latency, options: latencyOptions }).update();
    Object.assign(hitsChart, { data: hits, options: hitsOptions }).update();
  }

  function redraw() {
    timer ??= setTimeout(draw, 250);
  }

  darkness.addEventListener("change", redraw);
  return {
    requests(requests) {
      latest = requests;
      redraw();
    },
    uploads(summaries) {
      uploads = summaries;
      redraw();
    },
  };
}
