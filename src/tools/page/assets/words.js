// Numbers and sentences. All text that others chose reaches the page through textContent alone.

const MINUS = "\u2212";

// Whole numbers come as numbers, or as text where a number would lose digits.
function integerText(value) {
  if (typeof value === "string" && !/^-?\d+$/.test(value)) return value;
  return BigInt(value).toLocaleString("en-US").replace("-", MINUS);
}

// Four significant digits for reading; the exact number is shown where a row is unfolded.
function realText(value) {
  if (typeof value !== "number") return String(value).replace("-", MINUS);
  const size = Math.abs(value);
  if (size !== 0 && (size >= 1e16 || size < 1e-4)) return value.toExponential(3).replace("-", MINUS);
  const digits = size >= 1000 ? { maximumFractionDigits: 0 } : { maximumSignificantDigits: 4 };
  return value.toLocaleString("en-US", digits).replace("-", MINUS);
}

function withUnit(text, unit) {
  return unit ? `${text}\u00a0${unit}` : text;
}

function counted(count, noun) {
  return `${count.toLocaleString("en-US")} ${noun}${count === 1 ? "" : "s"}`;
}

function dateText(date) {
  if (date === null) return "an unknown day";
  const day = new Date(`${date}T00:00:00Z`);
  if (Number.isNaN(day.getTime())) return date;
  return day.toLocaleDateString("en-GB", {
    weekday: "long", day: "numeric", month: "long", year: "numeric", timeZone: "UTC",
  });
}

function shortDate(date) {
  if (date === null) return "unknown day";
  const day = new Date(`${date}T00:00:00Z`);
  if (Number.isNaN(day.getTime())) return date;
  return day.toLocaleDateString("en-GB", { weekday: "short", day: "numeric", month: "short", timeZone: "UTC" });
}

function momentText(stamp) {
  return stamp ? `${stamp.replace("T", " ").replace("Z", "")} UTC` : "an unknown time";
}

// The true values that a reported one can stand for; null where that is not known.
function rangeOf(block, value, range) {
  if (range < 0 || value === "?") return null;
  const [below, above, hasGaps] = block.ranges[range];
  // The differences are those of 64 bits: the true values may all lie on one side of the value.
  const within = (number) => BigInt.asIntN(64, number);
  return { low: within(BigInt(value) - BigInt(below)), high: within(BigInt(value) + BigInt(above)), hasGaps };
}

function rangeText(range) {
  if (range === null) return "not known";
  if (range.low === range.high) return "exactly this";
  return `${integerText(range.low)} \u2013 ${integerText(range.high)}`;
}

function rangeSentence(range, unit, rounding) {
  if (range === null) return "Which true values it stands for is not known.";
  if (range.low === range.high) {
    return rounding ? "This value was not changed by the rounding: only one true value gives it."
      : "It is not rounded: the reported value is the true one.";
  }
  const count = range.high - range.low + 1n;
  const among = range.hasGaps ? "some of the" : "any of";
  return `The true value is ${among} ${integerText(count)} values from ${integerText(range.low)} to ` +
    `${withUnit(integerText(range.high), unit)}.`;
}

// "+100", the sign of a change for people.
function differenceText(value, former) {
  try {
    const difference = BigInt(value) - BigInt(former);
    return (difference > 0n ? "+" : "") + integerText(difference);
  } catch {
    return "changed";
  }
}

// "(10, 20]" as its two bounds; labels that are not of this form stay as they are.
function bucketWords(label, unit) {
  const bounds = /^\((-?[\w.+]+|-inf), (-?[\w.+]+)[\])]$/.exec(label);
  if (!bounds) return label;
  const [, lower, upper] = bounds;
  const number = (text) => (Number.isNaN(Number(text)) ? text : realText(Number(text)));
  if (lower === "-inf" && upper === "inf") return "any value";
  if (lower === "-inf") return `up to ${withUnit(number(upper), unit)}`;
  if (upper === "inf") return `above ${withUnit(number(lower), unit)}`;
  return `above ${number(lower)}, up to ${withUnit(number(upper), unit)}`;
}

// Characters that would reorder what is around them are shown by their number.
function visibleText(text) {
  return text.replace(/[\u061c\u200e\u200f\u202a-\u202e\u2066-\u2069]/g,
    (mark) => `\\u${mark.charCodeAt(0).toString(16).padStart(4, "0")}`);
}

// Makes an element; children are elements or text.
function make(tag, attributes, ...children) {
  const element = document.createElement(tag);
  for (const [name, value] of Object.entries(attributes || {})) {
    if (value !== null && value !== undefined && value !== false) element.setAttribute(name, value === true ? "" : value);
  }
  for (const child of children) {
    if (child !== null && child !== undefined) element.append(typeof child === "string" ? visibleText(child) : child);
  }
  return element;
}

function makeSvg(tag, attributes, ...children) {
  const element = document.createElementNS("http://www.w3.org/2000/svg", tag);
  for (const [name, value] of Object.entries(attributes)) element.setAttribute(name, value);
  element.append(...children);
  return element;
}
