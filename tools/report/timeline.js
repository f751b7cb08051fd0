// The time line: a lane for each application with its streams, volume as height, devices as colours,
// and a mark for each xrun. Zooms and pans; leads from a mark to the messages around it.
import { axisX, dot, gridX, plot, rect, ruleX, ruleY, text } from "@observablehq/plot";
import { select } from "d3-selection";
import { zoom, zoomIdentity } from "d3-zoom";
import { NO_DEVICE, deviceScale } from "./colours.js";
import { element } from "./elements.js";
import { clock, count, duration, figure, milliseconds, moment, named, plural, shortened, timeTick, visible } from "./text.js";

const MOST_LANES = 40;
const MOST_TRACKS = 6;
const LANE_HEIGHT = 46;
const NEAREST = 0.05; // seconds: the shortest time that the whole width may show
const OTHERS = "other applications";

// What a person must know about an xrun, in one sentence each.
export function describeXrun(xrun) {
  const lines = [`${named(xrun.app)} lost ${milliseconds(xrun.ms)}`];
  lines.push(`${moment(xrun.t)}${xrun.device ? `, on ${named(xrun.device)}` : ""}`);
  if (xrun.cycles) {
    const cycle = xrun.quantum && xrun.rate ? ` of ${count(xrun.quantum)} frames at ${count(xrun.rate)} Hz` : "";
    lines.push(`${plural(xrun.cycles, "missed cycle")}${cycle}`);
  }
  if (xrun.late) lines.push(`late: ${named(xrun.late)}`);
  if (xrun.role === "culprit") lines.push("this stream was late itself");
  if (xrun.role === "victim") lines.push("this stream was not late; it suffered from another");
  if (xrun.role === "device") lines.push("the device was late");
  return lines;
}

// The parts of a stream with one volume and one device: what is drawn as one rectangle.
function partsOf(stream, lane) {
  const changes = new Set([stream.from]);
  for (const [t] of stream.volumes) changes.add(t);
  for (const [t] of stream.routes) changes.add(t);
  const last = stream.to;
  const times = [...changes].filter((t) => t >= stream.from && t < last).sort((a, b) => a - b);
  const valueAt = (list, t) => list.reduce((found, entry) => (entry[0] <= t ? entry : found), undefined);
  return times.map((from, index) => {
    const volume = valueAt(stream.volumes, from);
    const route = valueAt(stream.routes, from);
    return {
      lane,
      stream,
      from,
      to: times[index + 1] ?? last,
      volume: volume?.[1] ?? null,
      // A stream that runs and reports no volume fills its lane.
      height: volume === undefined || !volume[2] ? 0 : (volume[1] ?? 1),
      device: route?.[1] || NO_DEVICE,
    };
  });
}

// Joins neighbouring parts of a stream that are narrower than `least` seconds: what cannot be seen is
// not drawn. The joined part has the greatest height and the device of the first.
function joined(parts, least) {
  const list = [];
  let open = null;
  for (const part of parts) {
    if (open && open.stream === part.stream && part.to - open.from < least) {
      open = { ...open, to: part.to, height: Math.max(open.height, part.height), volume: Math.max(open.volume, part.volume) };
      list[list.length - 1] = open;
    } else {
      list.push(part);
      open = part;
    }
  }
  return list;
}

// Places the streams of each application on as few tracks as possible, so that no two streams of a
// track overlap.
function lanesOf(streams, xruns) {
  const byApp = new Map();
  const of = (app) => byApp.get(app) ?? byApp.set(app, { app, streams: [], xruns: 0, ran: 0 }).get(app);
  for (const stream of streams) {
    const entry = of(stream.app);
    entry.streams.push(stream);
    entry.ran += stream.ran ?? 0;
  }
  for (const xrun of xruns) of(xrun.app).xruns += 1;
  const ordered = [...byApp.values()].sort((a, b) => b.xruns - a.xruns || b.ran - a.ran);
  const lanes = [];
  const laneOfStream = new Map();
  const laneOfApp = new Map();
  let hidden = 0;
  for (const entry of ordered) {
    if (lanes.length >= MOST_LANES) {
      hidden += 1;
      continue;
    }
    const ends = [];
    for (const stream of entry.streams.sort((a, b) => a.from - b.from)) {
      let track = ends.findIndex((free) => free <= stream.from);
      if (track < 0) track = Math.min(ends.length, MOST_TRACKS - 1);
      ends[track] = stream.to;
      laneOfStream.set(stream, lanes.length + track);
    }
    laneOfApp.set(entry.app, lanes.length);
    for (let track = 0; track < Math.max(1, ends.length); track += 1) lanes.push(track === 0 ? entry.app : "");
  }
  if (hidden > 0) {
    // The applications without a lane share one, because their marks must not be lost.
    for (const entry of ordered) if (!laneOfApp.has(entry.app)) laneOfApp.set(entry.app, lanes.length);
    lanes.push(OTHERS);
  }
  return { lanes, laneOfStream, laneOfApp, hidden };
}

// Makes the time line. `onChoose(index)` is called with the index of the xrun that was chosen.
export function timeline(data, onChoose) {
  const { streams, xruns, marks } = data;
  const margin = Math.max((data.period.to - data.period.from) * 0.01, 0.05);
  const whole = [data.period.from - margin, data.period.to + margin];
  const { lanes, laneOfStream, laneOfApp, hidden } = lanesOf(streams, xruns);
  const parts = streams.flatMap((stream) =>
    laneOfStream.has(stream) ? partsOf(stream, laneOfStream.get(stream)) : [],
  );
  const scale = deviceScale(data);
  const used = new Set(parts.map((part) => part.device));
  const loudest = Math.max(1, ...parts.map((part) => part.height));
  const points = xruns.map((xrun, index) => ({
    ...xrun,
    index,
    lane: (xrun.s >= 0 ? laneOfStream.get(streams[xrun.s]) : undefined) ?? laneOfApp.get(xrun.app) ?? 0,
  }));
  let domain = whole;
  let chosen = -1;
  let focused = points.length > 0 ? points.reduce((a, b) => (a.t <= b.t ? a : b)).index : -1;
  let width = 0;

  const frame = element("div", {
    class: "frame timeline",
    style: `min-height: ${lanes.length * LANE_HEIGHT + 62}px`,
    role: "group",
    "aria-label": "Time line of the streams. Tab reaches the first xrun; the arrow keys go from one to the next, "
      + "Enter shows the messages around it.",
  });
  const drawing = element("div");
  const tip = element("div", { class: "tip", hidden: true, "aria-hidden": "true" });
  const shown = element("span", { class: "timeline-shown quiet", role: "status" });
  frame.append(drawing, tip);

  const narrow = () => width < 560;
  const left = () => (narrow() ? 84 : 150);
  const right = 16;

  function draw() {
    const span = domain[1] - domain[0];
    const inside = (from, to) => to >= domain[0] && from <= domain[1];
    const toDate = (t) => new Date(t * 1000);
    const clip = (t) => toDate(Math.min(Math.max(t, domain[0]), domain[1]));
    const svg = plot({
      width,
      height: lanes.length * LANE_HEIGHT + 62,
      marginLeft: left(),
      marginRight: right,
      marginTop: 20,
      marginBottom: 42,
      style: { fontSize: "12px", color: "var(--ink)" },
      x: { type: "time", domain: domain.map(toDate), label: null },
      y: { axis: null, domain: [0, loudest * 1.25] },
      fy: { domain: lanes.map((_, lane) => lane), padding: 0.06, label: null, axis: null },
      r: { type: "identity" },
      color: { type: "ordinal", ...scale },
      marks: [
        text(lanes.map((_, lane) => lane), {
          fy: (lane) => lane,
          text: (lane) => shortened(lanes[lane], narrow() ? 11 : 20),
          frameAnchor: "left",
          textAnchor: "end",
          dx: -8,
          fill: "var(--ink)",
        }),
        axisX({ anchor: "bottom", tickFormat: timeTick(span), ticks: narrow() ? 3 : 7, label: null }),
        gridX({ ticks: narrow() ? 3 : 7, stroke: "var(--line)", strokeOpacity: 1 }),
        // The first rectangle shows how long a stream existed. Those above it show how loud it was.
        rect(streams.filter((stream) => laneOfStream.has(stream) && inside(stream.from, stream.to)), {
          x1: (stream) => clip(stream.from),
          x2: (stream) => clip(stream.to),
          y1: 0,
          y2: 1,
          fy: (stream) => laneOfStream.get(stream),
          fill: "var(--panel)",
          stroke: "var(--line)",
          ariaHidden: "true",
        }),
        rect(joined(parts.filter((part) => inside(part.from, part.to)), (span / width) * 2), {
          x1: (part) => clip(part.from),
          x2: (part) => clip(part.to),
          y1: 0,
          y2: "height",
          fy: "lane",
          fill: "device",
          fillOpacity: 0.85,
          ariaLabel: (part) => describePart(part),
          className: "part",
        }),
        ruleY([0], { stroke: "var(--line)" }),
        ruleX(marks.filter((mark) => inside(mark.t, mark.t)), {
          x: (mark) => toDate(mark.t),
          stroke: "var(--note)",
          strokeWidth: 2,
          strokeDasharray: "2,3",
          ariaLabel: (mark) => `${mark.kind}: ${visible(mark.text)}, ${moment(mark.t)}`,
          className: "mark",
          facet: null,
        }),
        ruleX(points.filter((xrun) => inside(xrun.t, xrun.t)), {
          x: (xrun) => toDate(xrun.t),
          y1: 0,
          y2: loudest * 1.08,
          fy: "lane",
          stroke: "var(--alarm)",
          strokeWidth: 1.5,
          ariaHidden: "true",
        }),
        dot(points.filter((xrun) => inside(xrun.t, xrun.t)), {
          x: (xrun) => toDate(xrun.t),
          y: loudest * 1.08,
          fy: "lane",
          // The area grows with the time lost, from 4 to 12 pixels.
          r: (xrun) => Math.min(12, 4 + Math.sqrt(Math.max(0, xrun.ms ?? 0)) / 3),
          symbol: { draw: drawTriangle },
          fill: "var(--alarm)",
          stroke: "var(--paper)",
          strokeWidth: 1,
          href: (xrun) => `#xrun-${xrun.index}`,
          ariaLabel: (xrun) => describeXrun(xrun).join(". "),
          className: "xruns",
          sort: { channel: "x" },
        }),
      ],
    });
    svg.removeAttribute("class");
    prepareMarks(svg);
    drawing.replaceChildren(svg);
    shown.textContent = `Shown: ${moment(domain[0])} to ${clock(domain[1])} (${duration(span)})`;
  }

  function describePart(part) {
    const stream = part.stream;
    const volume = part.height === 0 ? "silent" : part.volume === null ? "volume not reported" : `volume ${figure(part.volume)}`;
    return `${named(stream.app)}, ${stream.direction || "stream"}, ${volume}, ${named(part.device)}, `
      + `${moment(part.from)}, for ${duration(part.to - part.from)}`;
  }

  function prepareMarks(svg) {
    for (const link of svg.querySelectorAll("a")) {
      const index = Number((link.getAttribute("href") ?? link.getAttributeNS("http://www.w3.org/1999/xlink", "href")).slice(6));
      link.dataset.xrun = index;
      link.setAttribute("tabindex", index === focused ? "0" : "-1");
      const path = link.querySelector("path");
      link.setAttribute("aria-label", path.getAttribute("aria-label"));
      path.removeAttribute("aria-label");
      link.classList.toggle("chosen", index === chosen);
    }
  }

  // One listener for all marks: there may be 2,000, and they are drawn anew with each zoom.
  function onMarks(kind, action) {
    drawing.addEventListener(kind, (event) => {
      const link = event.target.closest("a[data-xrun]");
      if (link) action(link, Number(link.dataset.xrun), event);
    });
  }
  onMarks("focusin", (link, index) => {
    focused = index;
    showTip(link, describeXrun(xruns[index]));
  });
  onMarks("pointerover", (link, index) => showTip(link, describeXrun(xruns[index])));
  for (const kind of ["focusout", "pointerout"]) onMarks(kind, hideTip);
  onMarks("click", (link, index, event) => {
    event.preventDefault();
    choose(index);
    onChoose(index);
  });

  for (const [kind, action] of [
    ["pointerover", (shape) => {
      const [first, ...rest] = shape.getAttribute("aria-label").split(", ");
      showTip(shape, [first, rest.join(", ")]);
    }],
    ["pointerout", hideTip],
  ]) {
    drawing.addEventListener(kind, (event) => {
      const shape = event.target.closest(".part rect, .mark line");
      if (shape) action(shape);
    });
  }

  function showTip(target, [first, ...rest]) {
    tip.replaceChildren(element("strong", {}, first), ...rest.map((line) => element("div", {}, line)));
    tip.hidden = false;
    const box = target.getBoundingClientRect();
    const around = frame.getBoundingClientRect();
    const x = Math.min(Math.max(box.left - around.left + box.width / 2 - tip.offsetWidth / 2, 0), around.width - tip.offsetWidth);
    const above = box.top - around.top - tip.offsetHeight - 8;
    const nearTop = Math.min(box.bottom, box.top + 60) - around.top + 8;
    tip.style.left = `${x}px`;
    tip.style.top = `${box.top - tip.offsetHeight - 8 > 0 ? above : nearTop}px`;
  }

  function hideTip() {
    tip.hidden = true;
  }

  // The marks in the order of time, in which the arrow keys visit them.
  const inOrder = points.map((xrun) => xrun.index).sort((a, b) => xruns[a].t - xruns[b].t);

  function focusMark(index) {
    focused = index;
    const { t } = xruns[index];
    if (t < domain[0] || t > domain[1]) {
      const span = domain[1] - domain[0];
      setDomain([t - span / 2, t + span / 2]);
    }
    for (const link of frame.querySelectorAll("a")) {
      link.setAttribute("tabindex", Number(link.dataset.xrun) === index ? "0" : "-1");
    }
    frame.querySelector(`a[data-xrun="${index}"]`)?.focus();
  }

  frame.addEventListener("keydown", (event) => {
    const at = inOrder.indexOf(focused);
    const steps = { ArrowRight: at + 1, ArrowDown: at + 1, ArrowLeft: at - 1, ArrowUp: at - 1, Home: 0, End: inOrder.length - 1 };
    if (event.key in steps && event.target.closest("a")) {
      event.preventDefault();
      const next = inOrder[steps[event.key]];
      if (next !== undefined) focusMark(next);
    } else if (event.key === "+" || event.key === "=") {
      zoomBy(2);
    } else if (event.key === "-") {
      zoomBy(1 / 2);
    } else if (event.key === "0") {
      setDomain(whole);
    } else if (event.key === "Escape") {
      hideTip();
    }
  });

  // d3 zooms. Its transform says which part of the whole time is shown.
  const plotWidth = () => width - left() - right;
  let requested = 0;
  const zoomer = zoom()
    .scaleExtent([1, Math.max(1, (whole[1] - whole[0]) / NEAREST)])
    // The wheel without a modifier key scrolls the page, and one finger does too.
    .filter((event) => (event.type === "wheel" ? event.ctrlKey || event.metaKey || event.shiftKey
      : event.type.startsWith("touch") ? event.touches.length > 1 : !event.button))
    .on("zoom", ({ transform }) => {
      const perPixel = (whole[1] - whole[0]) / plotWidth();
      const from = whole[0] + ((left() - transform.x) / transform.k - left()) * perPixel;
      domain = [from, from + (whole[1] - whole[0]) / transform.k];
      hideTip();
      cancelAnimationFrame(requested);
      requested = requestAnimationFrame(draw);
    });

  function setDomain([from, to]) {
    const total = whole[1] - whole[0];
    const span = Math.min(Math.max(to - from, NEAREST), total);
    const start = Math.min(Math.max((from + to - span) / 2, whole[0]), whole[1] - span);
    const factor = total / span;
    const first = left() + ((start - whole[0]) / total) * plotWidth();
    select(drawing).call(zoomer.transform, zoomIdentity.translate(left() - factor * first, 0).scale(factor));
    cancelAnimationFrame(requested);
    draw();
  }

  function zoomBy(factor) {
    const middle = focused >= 0 && frame.contains(document.activeElement) && document.activeElement.closest("a")
      ? xruns[focused].t : (domain[0] + domain[1]) / 2;
    const half = (domain[1] - domain[0]) / factor / 2;
    const hadFocus = document.activeElement?.closest?.("a")?.dataset.xrun;
    setDomain([middle - half, middle + half]);
    if (hadFocus !== undefined) frame.querySelector(`a[data-xrun="${hadFocus}"]`)?.focus();
  }

  function pan(share) {
    const step = (domain[1] - domain[0]) * share;
    setDomain([domain[0] + step, domain[1] + step]);
  }

  function choose(index) {
    chosen = index;
    focused = index;
    for (const link of frame.querySelectorAll("a")) {
      link.classList.toggle("chosen", Number(link.dataset.xrun) === index);
    }
  }

  // Shows an xrun in the middle, with some seconds around it.
  function goTo(index) {
    choose(index);
    const { t, ms } = xruns[index];
    const half = Math.max(5, (3 * (ms ?? 0)) / 1000);
    setDomain([t - half, t + half]);
  }

  const button = (label, action) => element("button", { type: "button", onclick: action }, label);
  const tools = element(
    "div",
    { class: "tools", role: "toolbar", "aria-label": "What part of the time is shown" },
    button("Zoom in", () => zoomBy(2)),
    button("Zoom out", () => zoomBy(1 / 2)),
    button("Earlier", () => pan(-0.5)),
    button("Later", () => pan(0.5)),
    button("Show all", () => setDomain(whole)),
    shown,
  );
  const legend = element(
    "ul",
    { class: "legend", "aria-label": "Colours and marks" },
    scale.domain.map((device, index) =>
      used.has(device)
        ? element("li", {}, element("span", { class: "swatch", style: `background: ${scale.range[index]}` }), named(device))
        : null,
    ),
    xruns.length > 0 ? element("li", {}, element("span", { class: "swatch xrun" }), "xrun: larger marks lost more") : null,
    marks.length > 0 ? element("li", {}, element("span", { class: "swatch event" }), "changed settings or a capture") : null,
  );

  let whenDrawn;
  const drawn = new Promise((resolve) => {
    whenDrawn = resolve;
  });
  function fit() {
    zoomer.extent([[left(), 0], [width - right, 100]]).translateExtent([[left(), 0], [width - right, 100]]);
    setDomain(domain);
    whenDrawn();
  }
  new ResizeObserver(() => {
    const now = Math.floor(frame.clientWidth);
    if (now === width || now === 0) return;
    // With thousands of marks the first drawing takes a moment. What stands above is shown before it.
    const isFirst = width === 0;
    width = now;
    if (isFirst) setTimeout(fit);
    else fit();
  }).observe(frame);
  select(drawing).call(zoomer);

  return { element: element("div", {}, legend, tools, frame), goTo, hidden, drawn };
}

// A triangle that points down, to its moment.
function drawTriangle(context, size) {
  const r = Math.sqrt(size / Math.PI);
  context.moveTo(0, r);
  context.lineTo(-r, -r);
  context.lineTo(r, -r);
  context.closePath();
}
