// Numbers, times and texts as people read them.

// Characters that control, hide or reorder what is shown: controls, marks of direction, zero-width
// characters and byte order marks. Names come from clients. Kept equal to those of JsonText.cpp.
const HIDDEN = /[\u0000-\u001f\u007f-\u009f\u00ad\u061c\u115f\u1160\u180e\u200b-\u200f\u2028-\u202e\u2060-\u206f\u2800\u3164\ufeff\uffa0\ufff9-\ufffb]|\udb40[\udc00-\udc7f]/g;

export function visible(text) {
  return String(text ?? "").replace(
    HIDDEN,
    (character) => `[U+${character.codePointAt(0).toString(16).toUpperCase().padStart(4, "0")}]`,
  );
}

// At most `length` characters. Does not cut a character in two.
export function shortened(text, length) {
  const characters = [...visible(text)];
  return characters.length <= length ? characters.join("") : `${characters.slice(0, length - 1).join("")}…`;
}

// Names in tables and sentences are cut, because a client may choose 10,000 characters.
const LONGEST_NAME = 80;
export const named = (text) => shortened(text, LONGEST_NAME);

const two = (number) => String(number).padStart(2, "0");
const date = (seconds) => new Date(seconds * 1000);

export function day(seconds) {
  const at = date(seconds);
  return `${at.getFullYear()}-${two(at.getMonth() + 1)}-${two(at.getDate())}`;
}

export function clock(seconds) {
  const at = date(seconds);
  const milliseconds = String(at.getMilliseconds()).padStart(3, "0");
  return `${two(at.getHours())}:${two(at.getMinutes())}:${two(at.getSeconds())}.${milliseconds}`;
}

export const moment = (seconds) => `${day(seconds)} ${clock(seconds)}`;

const whole = new Intl.NumberFormat("en", { maximumFractionDigits: 0 });
export const count = (number) => whole.format(number);

// Three significant digits; no exponent for the sizes that occur here.
export function figure(number) {
  if (!Number.isFinite(number)) return "–";
  if (Math.abs(number) >= 1000) return whole.format(number);
  return String(Number(number.toPrecision(3)));
}

export function milliseconds(number) {
  if (!Number.isFinite(number)) return "–";
  return number >= 10000 ? `${figure(number / 1000)} s` : `${figure(number)} ms`;
}

export function duration(seconds) {
  if (!Number.isFinite(seconds)) return "–";
  if (seconds < 1) return `${figure(seconds * 1000)} ms`;
  if (seconds < 60) return `${figure(seconds)} s`;
  const total = Math.round(seconds);
  const parts = [
    [Math.floor(total / 86400), "d"],
    [Math.floor(total / 3600) % 24, "h"],
    [Math.floor(total / 60) % 60, "min"],
    [total % 60, "s"],
  ].filter(([value]) => value > 0);
  return parts.slice(0, 2).map(([value, unit]) => `${value} ${unit}`).join(" ");
}

export function plural(number, one, many = `${one}s`) {
  return `${count(number)} ${number === 1 ? one : many}`;
}

// Shows the times of an axis that spans so many seconds.
export function timeTick(span) {
  return (at) => {
    const seconds = at.getTime() / 1000;
    const text = clock(seconds);
    if (span < 20) return text.slice(3);
    if (span < 3 * 3600) return text.slice(0, 8);
    if (span < 2 * 86400) return text.slice(0, 5);
    return text.startsWith("00:00") ? day(seconds).slice(5) : `${day(seconds).slice(5)}\n${text.slice(0, 5)}`;
  };
}
