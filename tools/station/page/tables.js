"use strict";

const MAXIMUM_SHOWN_REPORTS = 200;
const MAXIMUM_SHOWN_FILES = 100;

function cell(label, content, className) {
  const made = element("td", { className, "data-label": label });
  made.append(content instanceof Node ? content : String(content));
  return made;
}

/** A session's ID: a link, or why there is none. */
function sessionCell(key) {
  return cell("session", key ? sessionLink(key) : element("span", { text: "–", title: "It names none" }));
}

/** Sessions with their parents in front of them and how deep they are; parents that never reported too. */
function treeOf(sessions) {
  const children = new Map();
  const add = (parent, key) => children.set(parent, [...(children.get(parent) ?? []), key]);
  const byFirst = [...sessions.values()].sort((a, b) => b.first - a.first);
  for (const session of byFirst) {
    const parent = session.parent === session.session ? "" : session.parent;
    if (parent && !sessions.has(parent) && !children.get("")?.includes(parent)) add("", parent);
    add(parent, session.session);
  }
  const tree = [];
  const seen = new Set();
  const walk = (key, depth) => {
    if (seen.has(key)) return;
    seen.add(key);
    tree.push({ key, depth });
    for (const child of children.get(key) ?? []) walk(child, depth + 1);
  };
  for (const key of children.get("") ?? []) walk(key, 0);
  for (const session of byFirst) walk(session.session, 0); // Whose parents are each other's.
  return tree;
}

function gapsText(delivery) {
  return delivery.missing === 0 ? "none" : `${countText(delivery.missing)}: ${delivery.gaps || "earlier"}`;
}

/** A table's rows by key. A row that stays is the same element: a click or the keyboard's place is not lost. */
class KeyedRows {
  constructor(section, labels) {
    this.body = section.querySelector("tbody");
    this.empty = section.querySelector(".empty");
    this.labels = labels;
    this.rows = new Map();
  }

  /** @param entries  [key, session's key, texts of the cells after the session's] for each row. */
  show(entries) {
    const shown = new Map(entries.map(([key, session, texts]) => [key, this.updated(key, session, texts)]));
    this.rows = shown;
    const rows = [...shown.values()];
    const isSame = rows.length === this.body.rows.length && rows.every((row, i) => row === this.body.rows[i]);
    if (!isSame) {
      const focused = document.activeElement;
      this.body.replaceChildren(...rows);
      if (this.body.contains(focused)) focused.focus();
    }
    this.empty.hidden = rows.length > 0;
  }

  updated(key, session, texts) {
    const row = this.rows.get(key) ?? this.made(session);
    texts.forEach((text, i) => setText(row.cells[i + 1], text));
    return row;
  }

  made(session) {
    const head = element("th", {
      scope: "row", children: [element("span", { className: "branch", "aria-hidden": "true" }), sessionLink(session)],
    });
    const cells = this.labels.map(([label, className]) => cell(label, "", className));
    return element("tr", { children: [head, ...cells], "data-key": session });
  }
}

class SessionsTable {
  constructor(section) {
    this.rows = new KeyedRows(section, [
      ["client"], ["device", "device"], ["first", "time"], ["last", "time"], ["events", "number"],
      ["datagrams", "number"], ["missing", "number"], ["files", "number"],
    ]);
  }

  draw(sessions, chosen) {
    const tree = treeOf(sessions);
    this.rows.show(tree.map(({ key }) => [key, key, this.texts(sessions.get(key))]));
    for (const { key, depth } of tree) {
      const row = this.rows.rows.get(key);
      const session = sessions.get(key);
      setText(row.querySelector(".branch"), depth > 0 ? `${"   ".repeat(depth - 1)}└ ` : "");
      row.classList.toggle("chosen", key === chosen);
      row.classList.toggle("unseen", !session);
      if (key === chosen) row.querySelector("a").setAttribute("aria-current", "true");
      else row.querySelector("a").removeAttribute("aria-current");
      row.cells[2].title = session?.devices.join(", ") ?? "";
      row.cells[7].classList.toggle("some", Boolean(session) && missingOf(session) > 0);
    }
  }

  /** Brings the chosen session's row into sight, without moving the page. */
  showChosen() {
    const row = this.rows.body.querySelector("tr.chosen");
    if (!row) return;
    const region = row.closest(".scroll");
    region.scrollTop = row.offsetTop - (region.clientHeight - row.offsetHeight) / 2;
  }

  texts(session) {
    if (!session) return ["named as a parent only", "", "", "", "", "", "", ""];
    const client = [session.senders.join(", "), session.clients.join("; ")].filter(Boolean).join(" · ");
    return [
      client || "–", session.devices.join(", ") || "–", timeText(session.first), timeText(session.last),
      countText(session.events.received), countText(session.datagrams.received), countText(missingOf(session)),
      countText(session.uploads + session.logData),
    ];
  }
}

function missingOf(session) {
  return session.events.missing + session.datagrams.missing;
}

class DeliveryTable {
  constructor(section) {
    this.rows = new KeyedRows(section, [
      ["by"], ["received", "number"], ["distinct", "number"], ["repeated", "number"], ["lost on purpose", "number"],
      ["came again", "number"], ["missing"],
    ]);
  }

  draw(sessions, chosen) {
    const entries = [];
    for (const { key } of treeOf(sessions)) {
      const session = sessions.get(key);
      if (!session || (chosen && key !== chosen)) continue;
      for (const [by, delivery] of [["HTTPS", session.events], ["UDP", session.datagrams]]) {
        if (delivery.received) entries.push([`${by} ${key}`, key, this.texts(by, delivery)]);
      }
    }
    this.rows.show(entries);
    for (const row of this.rows.rows.values()) row.cells[7].classList.toggle("some", row.cells[7].textContent !== "none");
  }

  texts(by, delivery) {
    const counts = [delivery.received, delivery.distinct, delivery.repeated, delivery.lost, delivery.retried];
    return [by, ...counts.map(countText), gapsText(delivery)];
  }
}

/** Reports, the newest first. */
class ReportsTable {
  constructor(section) {
    this.body = section.querySelector("tbody");
    this.empty = section.querySelector(".empty");
  }

  clear() {
    this.body.replaceChildren();
  }

  /** Puts records, the oldest first, above those that are there. */
  add(records, emptyText) {
    const rows = records.slice(-MAXIMUM_SHOWN_REPORTS).reverse().map((record) => this.row(record));
    this.body.prepend(...rows);
    while (this.body.rows.length > MAXIMUM_SHOWN_REPORTS) this.body.lastElementChild.remove();
    this.empty.hidden = this.body.rows.length > 0;
    setText(this.empty, emptyText);
  }

  row(record) {
    return element("tr", {
      className: record.lost ? "lost" : "",
      "data-number": record.n,
      children: [
        cell("", timeElement(record.time, { milliseconds: true }), "time"),
        sessionCell(record.session),
        cell("by", record.kind === "event" ? "HTTPS" : "UDP"),
        cell("method", record.method ?? "–", "number"),
        cell("status", record.status ?? "–", "number"),
        cell("no.", record.number ?? "–", "number"),
        this.fields(record),
      ],
    });
  }

  fields(record) {
    const made = element("td", { className: "fields" });
    const marks = { lost: "lost on purpose", repeated: "repeated", retried: "came again" };
    for (const [key, text] of Object.entries(marks)) {
      if (record[key]) made.append(element("span", { className: "mark", text }), " ");
    }
    made.append(this.facts(record.facts ?? {}));
    for (const [name, value] of Object.entries(record.fields ?? {})) {
      made.append(element("span", {
        className: "field", children: [element("b", { text: `${name}=` }), valueText(value)],
      }), " ");
    }
    if (record.omitted) made.append(element("span", { className: "mark", text: `${record.omitted} more` }), " ");
    return made;
  }

  /** What the reporting side adds to each report, filled in when somebody looks. */
  facts(facts) {
    const details = element("details", { children: [element("summary", { text: "more" })] });
    details.addEventListener("toggle", () => {
      if (details.childElementCount > 1) return;
      for (const [name, value] of Object.entries(facts)) {
        details.append(element("div", { children: [element("b", { text: `${name}=` }), valueText(value)] }));
      }
    });
    return details;
  }
}

class FilesTable {
  constructor(section) {
    this.body = section.querySelector("tbody");
    this.empty = section.querySelector(".empty");
  }

  clear() {
    this.body.replaceChildren();
  }

  add(records) {
    const rows = records.slice(-MAXIMUM_SHOWN_FILES).reverse().map((record) => this.row(record));
    this.body.prepend(...rows);
    while (this.body.rows.length > MAXIMUM_SHOWN_FILES) this.body.lastElementChild.remove();
    this.empty.hidden = this.body.rows.length > 0;
  }

  row(record) {
    const name = record.name ?? "–";
    const isLink = typeof record.link === "string" && record.link.startsWith("/uploads/");
    return element("tr", {
      children: [
        cell("", timeElement(record.time), "time"),
        sessionCell(record.session),
        cell("", record.kind === "upload" ? "upload" : "log data"),
        cell("", isLink ? element("a", { text: name, href: record.link, download: "" }) : name, "fields"),
        cell("", sizeText(record.bytes ?? 0), "number"),
      ],
    });
  }
}
