"use strict";

// Everything shown is made here, as text: whatever a report says, it can't become markup.

/** An element with text, a class and children. */
function element(name, { text, className, children = [], ...attributes } = {}) {
  const made = document.createElement(name);
  if (text !== undefined) made.textContent = text;
  if (className) made.className = className;
  for (const [attribute, value] of Object.entries(attributes)) made.setAttribute(attribute, value);
  made.append(...children);
  return made;
}

/** Sets an element's text when it is another one: what did not change is not drawn again. */
function setText(target, text) {
  if (target.textContent !== text) target.textContent = text;
}

const integerFormat = new Intl.NumberFormat("en");
const numberFormat = new Intl.NumberFormat("en", { maximumSignificantDigits: 5 });

function countText(count) {
  return integerFormat.format(count);
}

function numberText(number) {
  if (Number.isInteger(number) && Math.abs(number) < 1e6) return String(number);
  const size = Math.abs(number);
  for (const [unit, name] of [[1e12, "T"], [1e9, "G"], [1e6, "M"]]) {
    if (size >= unit && size < 1e16) return `${numberFormat.format(number / unit)} ${name}`;
  }
  return size >= 1e16 || (size > 0 && size < 1e-4) ? number.toExponential(3) : numberFormat.format(number);
}

function sizeText(bytes) {
  if (bytes < 1024) return `${bytes} B`;
  for (const [unit, name] of [[2 ** 30, "GiB"], [2 ** 20, "MiB"], [2 ** 10, "KiB"]]) {
    if (bytes >= unit) return `${(bytes / unit).toPrecision(3)} ${name}`;
  }
  return "";
}

/** The time of day, here, of seconds since 1970. */
function timeText(seconds, { milliseconds = false } = {}) {
  const date = new Date(seconds * 1000);
  if (!seconds || Number.isNaN(date.getTime())) return "–";
  const two = (number) => String(number).padStart(2, "0");
  const text = `${two(date.getHours())}:${two(date.getMinutes())}:${two(date.getSeconds())}`;
  return milliseconds ? `${text}.${String(date.getMilliseconds()).padStart(3, "0")}` : text;
}

function timeElement(seconds, options) {
  const text = timeText(seconds, options);
  if (text === "–") return element("span", { text });
  const iso = new Date(seconds * 1000).toISOString();
  return element("time", { text, datetime: iso, title: iso });
}

/** The address of one session's page. */
function sessionAddress(key) {
  return `/sessions?sequences=${encodeURIComponent(key)}`;
}

function sessionLink(key) {
  return element("a", {
    text: key,
    className: "short",
    href: sessionAddress(key),
    title: `Session ${key}`,
    "data-session": key,
  });
}

function valueText(value) {
  return typeof value === "string" ? value : JSON.stringify(value);
}
