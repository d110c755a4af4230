"use strict";

const MAXIMUM_POINTS = 400; // Of one line; older ones go.
const MAXIMUM_CHARTS = 24;
const CHART_WIDTH = 300;
const CHART_HEIGHT = 46;

function svg(name, attributes) {
  const made = document.createElementNS("http://www.w3.org/2000/svg", name);
  for (const [attribute, value] of Object.entries(attributes)) made.setAttribute(attribute, value);
  return made;
}

/** The number that a field's value is; datagrams carry all as text. */
function numberOf(value) {
  if (typeof value === "number") return value;
  if (typeof value !== "string" || !/^-?\d{1,17}(\.\d+)?([eE][-+]?\d{1,3})?$/.test(value)) return undefined;
  const number = Number(value);
  return Number.isFinite(number) ? number : undefined;
}

/** Points in time of each numeric field, by name. */
class Series {
  constructor() {
    this.fields = new Map();
  }

  take(record) {
    if (record.lost || record.repeated || !record.time) return;
    for (const [name, value] of Object.entries(record.fields ?? {})) {
      const number = numberOf(value);
      if (number === undefined) continue;
      let points = this.fields.get(name);
      if (!points) this.fields.set(name, (points = []));
      points.push({ time: record.time, value: number });
      // Late ones find their place.
      for (let i = points.length - 1; i > 0 && points[i - 1].time > points[i].time; i--) {
        [points[i - 1], points[i]] = [points[i], points[i - 1]];
      }
      if (points.length > MAXIMUM_POINTS) points.shift();
    }
  }
}

function isConstant(points) {
  return points.every((point) => point.value === points[0].value);
}

/** One field as a line. Hovering, touching or the arrow keys show the value of a moment. */
class Chart {
  constructor(name, moveCursor) {
    this.points = [];
    this.label = element("span", { text: name, className: "name", title: name });
    this.value = element("span", { className: "value" });
    this.low = element("span", {});
    this.when = element("span", {});
    this.high = element("span", {});
    this.line = svg("polyline", {});
    this.cursor = svg("line", { class: "cursor", y1: 0, y2: CHART_HEIGHT });
    this.drawing = svg("svg", {
      viewBox: `0 0 ${CHART_WIDTH} ${CHART_HEIGHT}`, preserveAspectRatio: "none", role: "img",
    });
    const base = svg("line", { class: "base", x1: 0, x2: CHART_WIDTH, y1: CHART_HEIGHT, y2: CHART_HEIGHT });
    this.drawing.append(base, this.line, this.cursor);
    this.root = element("figure", {
      className: "chart", tabindex: "0", "data-field": name,
      children: [
        element("figcaption", { children: [this.label, this.value] }),
        this.drawing,
        element("div", { className: "range", children: [this.low, this.when, this.high] }),
      ],
    });
    this.listen(moveCursor);
  }

  listen(moveCursor) {
    this.root.addEventListener("pointermove", (event) => {
      const box = this.drawing.getBoundingClientRect();
      moveCursor(this.timeAt((event.clientX - box.left) / Math.max(box.width, 1)));
    });
    this.root.addEventListener("pointerleave", () => moveCursor(undefined));
    this.root.addEventListener("blur", () => moveCursor(undefined));
    this.root.addEventListener("keydown", (event) => {
      const steps = { ArrowLeft: -1, ArrowRight: 1 }[event.key];
      if (!steps || this.points.length === 0) return;
      event.preventDefault();
      const last = this.points.length - 1;
      const index = this.cursorTime === undefined ? last : this.indexNear(this.cursorTime) + steps;
      moveCursor(this.points[Math.min(Math.max(index, 0), last)].time);
    });
  }

  timeAt(share) {
    const [first, last] = this.span();
    return first + Math.min(Math.max(share, 0), 1) * (last - first);
  }

  span() {
    return this.points.length === 0 ? [0, 0] : [this.points[0].time, this.points.at(-1).time];
  }

  indexNear(time) {
    let nearest = 0;
    this.points.forEach((point, i) => {
      if (Math.abs(point.time - time) < Math.abs(this.points[nearest].time - time)) nearest = i;
    });
    return nearest;
  }

  draw(points, cursorTime) {
    this.points = points;
    const values = points.map((point) => point.value);
    const low = Math.min(...values);
    const high = Math.max(...values);
    const [first, last] = this.span();
    this.placeX = (time) => (last > first ? ((time - first) / (last - first)) * CHART_WIDTH : CHART_WIDTH / 2);
    const placeY = (value) =>
      high > low ? CHART_HEIGHT - 2 - ((value - low) / (high - low)) * (CHART_HEIGHT - 4) : CHART_HEIGHT / 2;
    const place = (point) => `${this.placeX(point.time).toFixed(1)},${placeY(point.value).toFixed(1)}`;
    this.line.setAttribute("points", points.map(place).join(" "));
    setText(this.low, `min ${numberText(low)}`);
    setText(this.high, `max ${numberText(high)}`);
    this.drawing.setAttribute("aria-label",
      `${points.length} values from ${numberText(low)} to ${numberText(high)}, the latest ${numberText(values.at(-1))}`);
    this.showCursor(cursorTime);
  }

  showCursor(time) {
    this.cursorTime = time;
    if (this.points.length === 0) return;
    const point = time === undefined ? this.points.at(-1) : this.points[this.indexNear(time)];
    setText(this.value, numberText(point.value));
    const [first, last] = this.span();
    setText(this.when, time === undefined ? `in ${numberText(Number((last - first).toFixed(1)))} s`
      : timeText(point.time, { milliseconds: true }));
    const x = this.placeX(point.time).toFixed(1);
    this.cursor.setAttribute("x1", x);
    this.cursor.setAttribute("x2", x);
    this.cursor.setAttribute("visibility", time === undefined ? "hidden" : "visible");
  }
}

/** The charts of one session: those that change, and below them what stays the same. */
class ChartPanel {
  constructor(section) {
    this.grid = section.querySelector(".grid");
    this.constants = section.querySelector("dl");
    this.empty = section.querySelector(".empty");
    this.charts = new Map();
  }

  clear() {
    this.charts.clear();
    this.grid.replaceChildren();
    this.cursorTime = undefined;
  }

  draw(series, emptyText) {
    const constants = [];
    for (const [name, points] of series?.fields ?? []) {
      if (!this.charts.has(name) && (isConstant(points) || this.charts.size >= MAXIMUM_CHARTS)) {
        constants.push([name, points.at(-1).value]);
        continue;
      }
      this.chartNamed(name).draw(points, this.cursorTime);
    }
    this.constants.replaceChildren(...constants.map(([name, value]) => element("div", {
      children: [element("dt", { text: `${name} ` }), element("dd", { text: numberText(value) })],
    })));
    this.empty.hidden = this.charts.size > 0 || constants.length > 0;
    setText(this.empty, emptyText);
  }

  chartNamed(name) {
    let chart = this.charts.get(name);
    if (!chart) {
      chart = new Chart(name, (time) => this.moveCursor(time));
      this.charts.set(name, chart);
      this.grid.append(chart.root);
    }
    return chart;
  }

  /** All charts show the same moment. */
  moveCursor(time) {
    this.cursorTime = time;
    for (const chart of this.charts.values()) chart.showCursor(time);
  }
}
