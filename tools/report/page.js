// The page: reads the data and lays out the sections. The data is described in docs/report.md.
import { deviceScale } from "./colours.js";
import { comparison } from "./compare.js";
import * as draw from "./distributions.js";
import { element, numbers, section, table } from "./elements.js";
import { count, duration, figure, milliseconds, moment, named, plural, visible } from "./text.js";
import { describeXrun, timeline } from "./timeline.js";

const NUMBER = { number: true };
const LONG = { long: true };
const WORST = 10;

const data = JSON.parse(document.getElementById("data").textContent);
const { totals } = data;

function heading() {
  const { period, asked } = data;
  const bounds = [];
  if (asked.since !== null) bounds.push(`since ${moment(asked.since)}`);
  if (asked.until !== null) bounds.push(`before ${moment(asked.until)}`);
  return element(
    "header",
    {},
    element("h1", {}, "What the audio system reported"),
    element(
      "p",
      { class: "period" },
      period ? `${moment(period.from)} to ${moment(period.to)} (${duration(period.to - period.from)}). ` : "",
      `Records ${bounds.length > 0 ? bounds.join(" and ") : "of the whole store"}: ${visible(data.store)}. `
        + `Made ${moment(data.made)} by ${visible(data.program)}. Times are in this browser's time zone.`,
    ),
  );
}

function verdict() {
  if (!data.period) return element("p", { class: "verdict" }, "The store has no records of this period.");
  if (totals.xruns === 0) {
    return element("p", { class: "verdict" }, `No xrun was recorded in ${plural(totals.streams, "stream")}.`);
  }
  const worst = data.xruns.length > 0 ? data.xruns.reduce((a, b) => ((b.ms ?? 0) > (a.ms ?? 0) ? b : a)) : null;
  return element(
    "p",
    { class: "verdict" },
    element("strong", {}, `${plural(totals.xruns, "xrun")} lost ${milliseconds(totals.xrunMs)}. `),
    worst ? `The worst: ${describeXrun(worst).slice(0, 2).join(", ")}.` : "",
  );
}

function figures() {
  const entry = (name, value, alarm) => element("div", { class: alarm ? "alarm" : undefined }, element("dt", {}, name), element("dd", {}, value));
  return element(
    "dl",
    { class: "figures" },
    entry("Xruns", count(totals.xruns), totals.xruns > 0),
    entry("Time lost", milliseconds(totals.xrunMs), totals.xruns > 0),
    entry("Missed cycles", totals.xruns > 0 && totals.missedCycles === 0 ? "–" : count(totals.missedCycles), totals.missedCycles > 0),
    entry("Streams", count(totals.streams)),
    entry("Messages", count(totals.messages)),
    entry("Issue metrics", count(totals.metrics)),
    entry("Power events", count(totals.power)),
    entry("Captures", count(totals.snapshots)),
  );
}

const xrunColumns = (show) => [
  ["Time", (xrun) => element("a", { href: `#xrun-${xrun.index}`, onclick: (event) => show(event, xrun.index) }, moment(xrun.t))],
  ["Lost", (xrun) => milliseconds(xrun.ms), NUMBER],
  ["Application", (xrun) => named(xrun.app)],
  ["Missed cycles", (xrun) => (xrun.cycles > 0 ? count(xrun.cycles) : "–"), NUMBER],
  ["Device", (xrun) => named(xrun.device)],
  ["Late", (xrun) => named(xrun.late) || "–"],
  ["Part", (xrun) => visible(xrun.role) || "–"],
  ["Quantum", (xrun) => (xrun.quantum ? `${count(xrun.quantum)} at ${count(xrun.rate)} Hz` : "–"), NUMBER],
];

// Settled when the whole page is drawn, as far as it is on the screen.
let complete = Promise.resolve();

const around = element("div", { id: "around", tabindex: -1, role: "region", "aria-label": "Messages around the chosen xrun" });

// Shows what was recorded shortly before and after an xrun.
function showMessages(index) {
  const xrun = data.xruns[index];
  const [first, last] = xrun.around ?? [0, 0];
  const rows = data.messages.slice(first, last).map((message, at) => ({ ...message, own: first + at === xrun.message }));
  around.replaceChildren(
    element("h3", {}, `Messages around ${moment(xrun.t)}`),
    element("p", {}, `${describeXrun(xrun).join(". ")}.`),
    rows.length === 0
      ? element("p", { class: "note" }, "The messages around this xrun are not in the page: it keeps them for the worst xruns only.")
      : table(`The ${rows.length} messages recorded before and after this xrun`, [
        ["Time", (row) => moment(row.t)],
        ["From the xrun", (row) => `${row.t < xrun.t ? "−" : "+"}${duration(Math.abs(row.t - xrun.t))}`, NUMBER],
        ["Application", (row) => named(row.app)],
        ["Message", (row) => (row.own ? element("strong", {}, named(row.name)) : named(row.name))],
        ["Content", (row) => visible(row.text), LONG],
      ], rows),
  );
}

function volumesOf(stream) {
  const parts = stream.volumeTimes.map(([volume, seconds]) => `${duration(seconds)} at ${figure(volume)}`);
  if (stream.otherVolumes > 0) parts.push(`${duration(stream.otherVolumes)} at others`);
  return parts.join(", ") || "–";
}

function streamsTable() {
  return table(`${plural(data.streams.length, "stream")}, in the order of their starts`, [
    ["Started", (stream) => moment(stream.from)],
    ["Application", (stream) => named(stream.app)],
    ["Service", (stream) => named(stream.service)],
    ["Direction", (stream) => visible(stream.direction)],
    ["Ran", (stream) => duration(stream.ran), NUMBER],
    ["Devices", (stream) => [...new Set(stream.routes.map(([, device]) => named(device)))].join(" → ")],
    ["Time at volume", volumesOf],
    ["Format", (stream) => stream.formats.map(([, format]) => named(format)).join(" → ")],
    ["Xruns", (stream) => count(stream.xruns), NUMBER],
    ["Lost", (stream) => milliseconds(stream.xrunMs), NUMBER],
    ["Ended", (stream) => (stream.open ? visible(stream.end) : `${visible(stream.end)}, ${moment(stream.to)}`)],
  ], data.streams);
}

function timelineSection() {
  if (!data.period || (data.streams.length === 0 && data.xruns.length === 0)) {
    return [section("timeline", "Time line", element("p", {}, "No stream or session was recorded in this period."))];
  }
  const line = timeline(data, (index) => {
    showMessages(index);
    around.focus({ preventScroll: true });
    around.scrollIntoView({ block: "nearest" });
  });
  complete = line.drawn;
  const show = (event, index) => {
    event.preventDefault();
    line.goTo(index);
    showMessages(index);
    document.getElementById("timeline").scrollIntoView({ block: "start" });
  };
  const ordered = data.xruns.map((xrun, index) => ({ ...xrun, index }));
  const worst = [...ordered].sort((a, b) => (b.ms ?? 0) - (a.ms ?? 0)).slice(0, WORST);
  const worstSection = worst.length === 0 ? [] : [
    section("worst", "Worst xruns", element("p", { class: "quiet" }, "A time leads to its place in the time line and to the messages around it."),
      table(`The ${worst.length} xruns that lost most`, xrunColumns(show), worst)),
  ];
  return [
    ...worstSection,
    section(
      "timeline",
      "Time line",
      element("p", { class: "quiet" }, "A lane for each application; the height is the volume, the colour is the device. "
        + "Drag to move, Ctrl and the wheel to zoom, or use the buttons."),
      line.hidden > 0 ? element("p", { class: "note" }, `${plural(line.hidden, "application")} without a lane of their own are in the tables.`) : null,
      line.element,
      around,
      numbers(`Table of the ${plural(data.streams.length, "stream")}`, streamsTable),
      numbers(`Table of the ${plural(ordered.length, "xrun")} with a mark`, () => table(`${plural(ordered.length, "xrun")} in the order of their times`, xrunColumns(show), ordered)),
      data.marks.length > 0
        ? numbers(`Table of the ${plural(data.marks.length, "changed setting or capture", "changed settings and captures")}`, marksTable)
        : null,
    ),
  ];
}

function marksTable() {
  return table("Changed settings and captures", [
    ["Time", (mark) => moment(mark.t)],
    ["What", (mark) => mark.kind],
    ["Content", (mark) => visible(mark.text), LONG],
  ], data.marks);
}

function sections() {
  const made = [...timelineSection()];
  const add = (id, name, condition, ...children) => {
    if (condition) made.push(section(id, name, ...children));
  };
  add("applications", "Xruns by application and device", data.byApplication.length > 0, ...(data.byApplication.length > 0 ? draw.xrunsByApplication(data.byApplication, deviceScale(data)) : []));
  add("devices", "Cycles of the devices", data.devices.length > 0,
    element("p", { class: "quiet" }, "Each session reports what its devices did while it ran. A cycle in which several sessions ran is therefore counted several times."),
    ...(data.devices.length > 0 ? draw.deviceTimes(data.devices) : []),
    data.deviceCounters.length > 0 ? numbers("What the devices counted", () => table("What the devices counted, summed over the sessions", [
      ["Device", (row) => named(row.device)],
      ["Counter", (row) => named(row.counter)],
      ["Sum", (row) => count(row.sum), NUMBER],
      ["Reports", (row) => count(row.reports), NUMBER],
    ], data.deviceCounters)) : null);
  add("events", "Messages over time", data.names.series.length > 0,
    ...(data.names.series.length > 0 ? draw.eventsOverTime(data.names) : []),
    numbers("Table of all event names", () => draw.nameTable(data.names)));
  add("issues", "Issue metrics", data.issues.length > 0, ...(data.issues.length > 0 ? draw.issues(data.issues) : []));
  add("power", "Power events", data.power.length > 0, ...(data.power.length > 0 ? draw.power(data.power) : []));
  add("traces", "Trace intervals", data.traces !== null && data.traces.intervals.length > 0,
    data.traces ? element("p", { class: "quiet" }, `The latest trace: ${visible(data.traces.file)}, written ${moment(data.traces.when)}.`) : null,
    ...(data.traces ? draw.traceIntervals(data.traces.intervals) : []));
  made.push(missing());
  return made;
}

function missing() {
  return section(
    "missing",
    "What is not in this report",
    element("ul", {}, data.notes.map((note) => element("li", {}, visible(note)))),
    data.serviceLosses.length > 0
      ? table("What the service dropped, suppressed or refused", [
        ["Part of the service", (row) => named(row.piece)],
        ["Reason", (row) => named(row.reason)],
        ["Count", (row) => count(row.count), NUMBER],
        ["Last recorded", (row) => moment(row.last), NUMBER],
      ], data.serviceLosses)
      : element("p", {}, "The service recorded nothing as dropped, suppressed or refused in this period."),
    data.losses.length > 0
      ? table("What is not shown one by one, or was shortened", [
        ["What", (row) => visible(row.what)],
        ["Reason", (row) => visible(row.reason)],
        ["Count", (row) => count(row.count), NUMBER],
      ], data.losses)
      : null,
  );
}

function report() {
  const content = sections();
  document.title = `Halvox report: ${plural(totals.xruns, "xrun")}, ${plural(totals.streams, "stream")}`;
  return [
    heading(),
    element("nav", { "aria-label": "Sections" }, element("ul", {}, content.map((one) => element("li", {}, element("a", { href: `#${one.id}` }, one.querySelector("h2").textContent))))),
    element("main", { id: "main", tabindex: -1 }, verdict(), figures(), ...content),
    element("footer", { class: "quiet" }, element("p", {}, `${figure(totals.events)} events, ${figure(totals.links)} messages of the link.`)),
  ];
}

document.getElementById("page").replaceWith(...(data.changes ? comparison(data) : report()));
performance.mark("report-laid-out");
complete.then(() => {
  performance.mark("report-ready");
  // Tests wait for this attribute.
  document.documentElement.dataset.ready = "true";
});
