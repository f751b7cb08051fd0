// The page of a comparison: what changed between two periods, and how sure that is.
import { axisX, dot, gridX, plot, ruleX, ruleY } from "@observablehq/plot";
import { element, picture, section, table } from "./elements.js";
import { count, duration, figure, milliseconds, moment, named, plural, shortened, visible } from "./text.js";

const NUMBER = { number: true };
const STYLE = { fontSize: "12px", color: "var(--ink)" };
const COLOURS = { worse: "var(--alarm)", higher: "var(--route-4)", unclear: "var(--quiet)", lower: "var(--route-1)", better: "var(--route-2)" };
const MOST_DRAWN = 40;

const label = (change) => (change.of ? `${change.what}, ${change.of}` : change.what);
const value = (number, unit) => (number === null ? "–" : `${figure(number)}${unit.startsWith("/") ? "" : " "}${visible(unit)}`);
const times = (ratio) => (ratio === null ? "–" : `×${figure(ratio)}`);
const interval = (change) => (change.low === null ? "–" : `${times(change.low)} to ${times(change.high)}`);

// A dot for each ratio, a line for its interval. Left of 1 is less, right of 1 is more.
function forest(width, changes) {
  const rows = changes.map((change, index) => ({ ...change, row: `${index}` }));
  return plot({
    width,
    height: rows.length * 24 + 56,
    marginLeft: width < 560 ? 120 : 330,
    marginRight: 24,
    marginBottom: 36,
    style: STYLE,
    x: { type: "log", label: null },
    y: {
      domain: rows.map((change) => change.row),
      label: null,
      tickSize: 0,
      tickFormat: (row) => shortened(label(rows[Number(row)]), width < 560 ? 16 : 50),
    },
    marks: [
      gridX({ stroke: "var(--line)", strokeOpacity: 1, ticks: width < 560 ? 3 : 8 }),
      axisX({ label: "after beside before →", ticks: width < 560 ? 3 : 8, tickFormat: (ratio) => times(ratio) }),
      ruleX([1], { stroke: "var(--ink)" }),
      ruleY(rows, { x1: "low", x2: "high", y: "row", stroke: (change) => COLOURS[change.verdict], strokeWidth: 2 }),
      dot(rows, { x: "ratio", y: "row", fill: (change) => COLOURS[change.verdict], r: 4 }),
    ],
  });
}

function side(name, { store, from, to, ran, totals }) {
  return element(
    "p",
    { class: "period" },
    element("strong", {}, `${name}: `),
    from === null
      ? "no records. "
      : `${moment(from)} to ${moment(to)}. ${plural(totals.streams, "stream")} ran ${duration(ran)} and lost `
        + `${milliseconds(totals.xrunMs)} in ${plural(totals.xruns, "xrun")}. `,
    visible(store),
  );
}

function verdict(changes) {
  const of = (name) => changes.filter((change) => change.verdict === name).length;
  const worse = changes.find((change) => change.verdict === "worse");
  if (worse) {
    return element("p", { class: "verdict" }, element("strong", {}, `${plural(of("worse"), "figure")} got worse. `),
      `Most of all ${named(label(worse))}: ${times(worse.ratio)}; the true ratio is between ${times(worse.low)} and ${times(worse.high)} in 95 of 100 cases.`);
  }
  return element("p", { class: "verdict" }, of("better") > 0
    ? `Nothing got worse beyond chance; ${plural(of("better"), "figure")} got better.`
    : "Nothing got worse or better beyond chance.");
}

export function comparison(data) {
  const { changes } = data;
  const drawn = changes.filter((change) => change.low !== null && change.low > 0).slice(0, MOST_DRAWN);
  const sections = [
    section("changes", "Figures",
      element("p", { class: "quiet" }, "What got worse beyond chance comes first, the largest ratio first; then what is higher, "
        + "unclear, lower and better. A line is the interval in which the true ratio is in 95 of 100 cases."),
      drawn.length > 0 ? picture(`Ratios of ${plural(drawn.length, "figure")}: ${drawn.slice(0, 5).map((change) => `${named(label(change))} ${times(change.ratio)}, ${change.verdict}`).join("; ")}`,
        (width) => forest(width, drawn), { height: drawn.length * 24 + 56 }) : null,
      table(`${plural(changes.length, "figure")} of both periods`, [
        ["What", (change) => named(change.what)],
        ["Of", (change) => named(change.of) || "–"],
        ["Verdict", (change) => change.verdict],
        ["Before", (change) => value(change.before, change.unit), NUMBER],
        ["After", (change) => value(change.after, change.unit), NUMBER],
        ["Ratio", (change) => times(change.ratio), NUMBER],
        ["95 % interval", interval, NUMBER],
      ], changes)),
    section("method", "How sure this is",
      element("ul", {},
        element("li", {}, "A rate of xruns is for each hour in which streams ran. Each stream is one observation, because a "
          + "stream that stutters once stutters again. With fewer than three streams on a side there is no interval."),
        element("li", {}, "A percentile of cycles is the upper bound of its bucket. Each report of a device is one observation."),
        element("li", {}, "A rate of events or issues is for each hour of the period, and each of 32 parts of it is one observation."),
        element("li", {}, "With many figures, one in twenty that did not change looks as if it did. Ask for the same comparison of another pair of days."))),
  ];
  document.title = `Halvox comparison: ${count(changes.filter((change) => change.verdict === "worse").length)} worse`;
  return [
    element("header", {}, element("h1", {}, "What changed"), side("Before", data.before), side("After", data.after),
      element("p", { class: "period" }, `Made ${moment(data.made)} by ${visible(data.program)}. Times are in this browser's time zone.`)),
    element("main", { id: "main", tabindex: -1 }, verdict(changes), ...sections),
  ];
}
