// Builds elements. All texts become text nodes: nothing from a client is ever parsed as HTML.

export function element(name, attributes = {}, ...children) {
  const made = document.createElement(name);
  for (const [key, value] of Object.entries(attributes)) {
    if (value === undefined || value === null || value === false) continue;
    if (key.startsWith("on")) made.addEventListener(key.slice(2), value);
    else made.setAttribute(key, value === true ? "" : value);
  }
  made.append(...children.flat().filter((child) => child !== null && child !== undefined));
  return made;
}

// A section with a heading that links and assistive technology can find.
export function section(id, heading, ...children) {
  return element(
    "section",
    { id, "aria-labelledby": `${id}-heading` },
    element("h2", { id: `${id}-heading` }, heading),
    ...children,
  );
}

const ROWS_AT_ONCE = 200;

// A table with the numbers of a picture. `columns` are [heading, function that returns the content
// of a row's cell, options]; a column with {number: true} is aligned to the right. Of a long table,
// only the first rows are shown at first.
export function table(caption, columns, rows) {
  const body = element("tbody");
  const add = (from, to) => {
    for (const row of rows.slice(from, to)) {
      const cells = columns.map(([, show, options = {}], index) => {
        const kind = index === 0 ? "th" : "td";
        const cell = element(kind, {
          scope: index === 0 ? "row" : undefined,
          class: options.number ? "number" : options.long ? "long" : undefined,
        });
        cell.append(show(row) ?? "");
        return cell;
      });
      body.append(element("tr", {}, cells));
    }
  };
  add(0, ROWS_AT_ONCE);
  const made = element(
    "table",
    {},
    element("caption", {}, caption),
    element(
      "thead",
      {},
      element(
        "tr",
        {},
        columns.map(([heading, , options = {}]) =>
          element("th", { scope: "col", class: options.number ? "number" : undefined }, heading),
        ),
      ),
    ),
    body,
  );
  // A region that scrolls must be reachable with the keyboard.
  const box = element("div", { class: "scroll", tabindex: 0, role: "region", "aria-label": caption }, made);
  if (rows.length <= ROWS_AT_ONCE) return box;
  const more = element(
    "button",
    {
      type: "button",
      onclick: () => {
        add(ROWS_AT_ONCE, rows.length);
        more.remove();
      },
    },
    `Show all ${rows.length} rows`,
  );
  return element("div", {}, box, more);
}

// A table that opens below its picture. It is made when it is first opened or printed.
export function numbers(title, makeTable, { open = false } = {}) {
  const details = element("details", { class: "numbers" }, element("summary", {}, title));
  let made = false;
  const fill = () => {
    if (!details.open || made) return;
    made = true;
    details.append(makeTable());
  };
  details.addEventListener("toggle", fill);
  details.open = open;
  fill();
  window.addEventListener("beforeprint", () => {
    details.open = true;
    fill();
  });
  return details;
}

// A picture that is drawn when it comes near the screen or is printed, and again when its width
// changes. What nobody looks at yet does not delay what they do.
export function picture(label, draw, { height = 170 } = {}) {
  const frame = element("div", { class: "frame", role: "img", "aria-label": label, style: `min-height: ${height}px` });
  let width = 0;
  let near = false;
  const redraw = () => {
    const now = Math.floor(frame.clientWidth);
    if (!near || now === width || now === 0) return;
    width = now;
    frame.replaceChildren(draw(width));
  };
  const drawNow = () => {
    near = true;
    redraw();
  };
  new ResizeObserver(redraw).observe(frame);
  const watch = new IntersectionObserver(
    (entries) => {
      if (!entries.some((entry) => entry.isIntersecting)) return;
      watch.disconnect();
      drawNow();
    },
    { rootMargin: "600px" },
  );
  watch.observe(frame);
  window.addEventListener("beforeprint", drawNow);
  return frame;
}
