// The pictures of numbers: how often, how long, how many. Each has its table below it.
import { axisX, axisY, barX, gridX, gridY, plot, rectY, ruleX, ruleY, text } from "@observablehq/plot";
import { COLOURS, NO_DEVICE } from "./colours.js";
import { element, numbers, picture, table } from "./elements.js";
import { count, duration, figure, milliseconds, moment, named, shortened, timeTick, visible } from "./text.js";

const STYLE = { fontSize: "12px", color: "var(--ink)" };
const NUMBER = { number: true };
const leftOf = (width) => (width < 560 ? 110 : 190);

// The driver reports have no blanks in the names of their channels.
const MEASURES = { busytime: "busy time", waittime: "wait time" };
const measureOf = (row) => MEASURES[row.measure] ?? row.measure;

const COMMON_PREFIX = "com.tarno.halvox.";
const withoutPrefix = (name) => (name.startsWith(COMMON_PREFIX) ? name.slice(COMMON_PREFIX.length) : name);

function legendOf(names, colours = COLOURS) {
  return element(
    "ul",
    { class: "legend" },
    names.map((name, index) =>
      element("li", {}, element("span", { class: "swatch", style: `background: ${colours[index % colours.length]}` }), named(name)),
    ),
  );
}

// Horizontal bars, one for each row, in parts that are coloured by `part`.
function bars(width, rows, { label, value, part, parts, axis, colours = COLOURS }) {
  const labels = [...new Set(rows.map(label))];
  const sums = labels.map((name) => ({
    name,
    sum: rows.filter((row) => label(row) === name).reduce((sum, row) => sum + value(row), 0),
  }));
  // A scale of counts has no fractions.
  const most = Math.max(...sums.map((row) => row.sum));
  return plot({
    width,
    height: labels.length * 28 + 56,
    marginLeft: leftOf(width),
    marginRight: 56,
    marginBottom: 36,
    style: STYLE,
    x: { label: axis, nice: true, labelAnchor: "right", axis: null },
    y: { domain: labels, label: null, tickSize: 0, tickFormat: (name) => shortened(name, width < 560 ? 15 : 27) },
    color: { type: "ordinal", domain: parts, range: parts.map((_, index) => colours[index % colours.length]) },
    marks: [
      gridX({ stroke: "var(--line)", strokeOpacity: 1, ...(most <= 10 ? { interval: 1 } : {}) }),
      axisX({ label: axis, tickFormat: figure, ...(most <= 10 ? { interval: 1 } : { ticks: width < 560 ? 4 : 8 }) }),
      barX(rows, { x: value, y: label, fill: part, insetTop: 3, insetBottom: 3, order: parts }),
      text(
        sums,
        { x: "sum", y: "name", text: (row) => figure(row.sum), textAnchor: "start", dx: 5, fill: "var(--ink)" },
      ),
      ruleX([0], { stroke: "var(--quiet)" }),
    ],
  });
}

// `scale` has the colours of the devices.
export function xrunsByApplication(rows, scale) {
  const complete = rows.map((row) => ({ ...row, device: row.device || NO_DEVICE }));
  const used = scale.domain.filter((device) => complete.some((row) => row.device === device));
  const usedColours = used.map((device) => scale.range[scale.domain.indexOf(device)]);
  const shown = complete.slice(0, 40);
  return [
    legendOf(used, usedColours),
    picture(
      `Bars: xruns of each application, by device. ${shown.slice(0, 5).map((row) => `${named(row.app)} on ${named(row.device)}: ${count(row.xruns)}`).join("; ")}`,
      (width) => bars(width, shown, { label: (row) => row.app, value: (row) => row.xruns, part: (row) => row.device, parts: used, colours: usedColours, axis: "xruns" }),
    ),
    table("Xruns of each application and device", [
      ["Application", (row) => named(row.app)],
      ["Device", (row) => named(row.device)],
      ["Xruns", (row) => count(row.xruns), NUMBER],
      ["Missed cycles", (row) => count(row.cycles), NUMBER],
      ["Time lost", (row) => milliseconds(row.ms), NUMBER],
      ["Longest", (row) => milliseconds(row.longest), NUMBER],
    ], complete),
  ];
}

// Buckets whose bounds grow by factors look right on a logarithmic axis. The last bucket may have no
// upper bound; it is drawn as wide as the one before it.
function bucketsOf(measure) {
  const { buckets } = measure;
  const lowest = Math.min(...buckets.flatMap(([from, to]) => [from, to]).filter((bound) => bound > 0));
  return buckets.map(([from, to, hits]) => {
    const x1 = Math.max(from, lowest / 2);
    return { x1, x2: to === null ? x1 * 2 : to, from, to, hits };
  });
}

export function histogram(label, measure, unit) {
  const rows = bucketsOf(measure);
  // Percentiles in one bucket share a line.
  const byValue = new Map();
  for (const name of ["p50", "p95", "p99"]) {
    if (measure[name] > 0) byValue.set(measure[name], [...(byValue.get(measure[name]) ?? []), name]);
  }
  const percentiles = [...byValue].map(([value, names]) => [names.join(" "), value]);
  return picture(
    `Histogram: ${label}. Half at most ${figure(measure.p50)} ${unit}, 95 % at most ${figure(measure.p95)} ${unit}, `
      + `highest ${figure(measure.max)} ${unit}.`,
    (width) =>
      plot({
        width,
        height: 170,
        marginLeft: 60,
        marginRight: 20,
        marginTop: 26,
        marginBottom: 38,
        style: STYLE,
        x: { type: "log", label: `${unit} →` },
        y: { label: "how many", grid: false, nice: true },
        marks: [
          gridY({ stroke: "var(--line)", strokeOpacity: 1 }),
          axisX({ ticks: width < 560 ? 3 : 6, tickFormat: figure, label: `${unit} →` }),
          axisY({ ticks: 3, label: "how many", tickFormat: figure }),
          rectY(rows, { x1: "x1", x2: "x2", y: "hits", fill: "var(--route-1)", inset: 0.5 }),
          ruleX(percentiles, { x: (row) => row[1], stroke: "var(--note)", strokeWidth: 1.5 }),
          text(percentiles, { x: (row) => row[1], text: (row) => row[0], frameAnchor: "top", dy: -14, fill: "var(--note)" }),
          ruleY([0], { stroke: "var(--quiet)" }),
        ],
      }),
  );
}

function bucketTable(caption, measure, unit) {
  return table(caption, [
    [`From (${unit})`, ([from]) => figure(from), NUMBER],
    [`To (${unit})`, ([, to]) => (to === null ? "no bound" : figure(to)), NUMBER],
    ["How many", ([, , hits]) => count(hits), NUMBER],
  ], measure.buckets);
}

function percentileTable(caption, first, rows, unitOf) {
  const atMost = (value, row) => `${figure(value)} ${unitOf(row)}`;
  return table(caption, [
    ...first,
    ["Count", (row) => count(row.count), NUMBER],
    ["p50", (row) => atMost(row.p50, row), NUMBER],
    ["p95", (row) => atMost(row.p95, row), NUMBER],
    ["p99", (row) => atMost(row.p99, row), NUMBER],
    ["Highest", (row) => atMost(row.max, row), NUMBER],
  ], rows);
}

export function deviceTimes(devices) {
  return [
    ...devices.map((row) => {
      const title = `${named(row.device)}: ${named(measureOf(row))}`;
      return element("div", {}, element("h3", {}, title), histogram(title, row, row.unit),
        numbers("The numbers of this picture", () => bucketTable(title, row, row.unit)));
    }),
    percentileTable("Times of the devices; each figure is the upper bound of its bucket", [
      ["Device", (row) => named(row.device)],
      ["Measure", (row) => named(measureOf(row))],
    ], devices, (row) => row.unit),
  ];
}

export function traceIntervals(intervals) {
  return [
    ...intervals.map((row) => {
      const title = named(row.name);
      return element("div", {}, element("h3", {}, title), histogram(title, row, "us"),
        numbers("The numbers of this picture", () => bucketTable(title, row, "us")));
    }),
    percentileTable("Intervals of the trace", [["Interval", (row) => named(row.name)]], intervals, () => "us"),
  ];
}

// How many messages of each name there were over time, stacked. The most frequent names have colours
// of their own; the others are added up.
export function eventsOverTime(names) {
  const { from, step, series } = names;
  const top = series.filter((one) => one.drawn).slice(0, 7);
  const rows = [];
  const steps = Math.max(1, ...series.flatMap((one) => one.bins.map(([bin]) => bin + 1)));
  const others = new Array(steps).fill(0);
  for (const one of series.filter((other) => other.drawn && !top.includes(other))) for (const [bin, n] of one.bins) others[bin] += n;
  const add = (name, counts) => counts.forEach((n, bin) => rows.push({ name, at: new Date((from + bin * step) * 1000), to: new Date((from + (bin + 1) * step) * 1000), n }));
  for (const one of top) {
    const counts = new Array(steps).fill(0);
    for (const [bin, n] of one.bins) counts[bin] = n;
    add(withoutPrefix(one.name), counts);
  }
  const drawn = top.map((one) => withoutPrefix(one.name));
  if (others.some((n) => n > 0)) {
    add("other names", others);
    drawn.push("other names");
  }
  const visibleRows = rows.filter((row) => row.n > 0);
  const span = steps * step;
  return [
    legendOf(drawn),
    picture(
      `Bars over time: messages of each name in steps of ${duration(step)}. ${top.slice(0, 4).map((one) => `${named(withoutPrefix(one.name))}: ${count(one.count)}`).join("; ")}`,
      (width) =>
        plot({
          width,
          height: 240,
          marginLeft: 60,
          marginRight: 16,
          marginBottom: 42,
          style: STYLE,
          x: { type: "time", domain: [new Date(from * 1000), new Date((from + span) * 1000)] },
          y: { label: `messages in ${duration(step)}`, nice: true },
          color: { type: "ordinal", domain: drawn, range: COLOURS },
          marks: [
            gridY({ stroke: "var(--line)", strokeOpacity: 1 }),
            axisX({ ticks: width < 560 ? 3 : 7, label: null, tickFormat: timeTick(span) }),
            axisY({ ticks: 4, tickFormat: figure, label: `messages in ${duration(step)}` }),
            rectY(visibleRows, { x1: "at", x2: "to", y: "n", fill: "name", order: drawn, insetLeft: 0.5 }),
            ruleY([0], { stroke: "var(--quiet)" }),
          ],
        }),
    ),
  ];
}

export function nameTable(names) {
  return table("Events in the store, by name", [
    ["Name", (row) => named(row.name), { long: true }],
    ["Events", (row) => count(row.count), NUMBER],
    ["First", (row) => moment(row.first)],
    ["Last", (row) => moment(row.last)],
  ], names.series);
}

export function issues(rows) {
  const shown = rows.slice(0, 30);
  const label = (row) => `${row.type || "issue"}: ${row.client || row.node || "unknown"}`;
  return [
    picture(
      `Bars: issue metrics. ${shown.slice(0, 5).map((row) => `${named(label(row))}: ${count(row.count)}`).join("; ")}`,
      (width) => bars(width, shown, { label, value: (row) => row.count, part: (row) => row.metric, parts: [...new Set(shown.map((row) => row.metric))], axis: "metrics" }),
    ),
    table("Issue metrics", [
      ["Metric", (row) => visible(row.metric)],
      ["Issue", (row) => named(row.type)],
      ["Client", (row) => named(row.client)],
      ["Node", (row) => named(row.node)],
      ["Count", (row) => count(row.count), NUMBER],
      ["First", (row) => moment(row.first)],
      ["Last", (row) => moment(row.last)],
    ], rows),
  ];
}

export function power(rows) {
  const shown = rows.slice(0, 30);
  return [
    picture(
      `Bars: power events. ${shown.slice(0, 5).map((row) => `${named(row.name)}: ${count(row.count)}`).join("; ")}`,
      (width) => bars(width, shown, { label: (row) => row.name, value: (row) => row.count, part: () => "events", parts: ["events"], axis: "events" }),
    ),
    table("Power events", [
      ["Name", (row) => named(row.name)],
      ["Category", (row) => String(row.category), NUMBER],
      ["Count", (row) => count(row.count), NUMBER],
      ["First", (row) => moment(row.first)],
      ["Last", (row) => moment(row.last)],
    ], rows),
  ];
}

