"use strict";

const MAXIMUM_RECORDS = 4000; // Kept here; the oldest go.
const MAXIMUM_SESSIONS = 500; // As many as the station keeps.
const DRAW_EVERY = 200; // Milliseconds.
const RETRY_AFTER = 5000; // Milliseconds.
const HIDDEN_FOR = 5000; // Milliseconds after which a page that nobody sees gives its live connection back.

/** The session that the address asks for: "?sequences=ID", as the daemon's display URL has it. */
function sessionInAddress() {
  const asked = new URLSearchParams(location.search).get("sequences")?.trim() ?? "";
  const own = asked.split(".").at(-1);
  // The daemon writes the upper half of its 32-bit IDs as negative numbers.
  return /^-\d{1,10}$/.test(own) ? String(Number(own) + 2 ** 32) : own;
}

class Page {
  constructor() {
    const section = (id) => document.getElementById(id);
    this.sessionsTable = new SessionsTable(section("sessions"));
    this.reportsTable = new ReportsTable(section("reports"));
    this.deliveryTable = new DeliveryTable(section("delivery"));
    this.filesTable = new FilesTable(section("files"));
    this.chartPanel = new ChartPanel(section("charts"));
    this.selection = section("selection");
    this.selectionTitle = section("selection-title");
    this.selectionNote = section("selection-note");
    this.totals = section("totals");
    this.behind = section("behind");
    this.pauseButton = section("pause");
    this.isPaused = false;
    this.missed = 0;
    this.forget();
    this.listen();
    this.choose(sessionInAddress());
  }

  listen() {
    this.pauseButton.addEventListener("click", () => this.setPaused(!this.isPaused));
    document.addEventListener("click", (event) => this.follow(event));
    window.addEventListener("popstate", () => this.choose(sessionInAddress()));
  }

  /** A link to a session shows it here, without loading the page again. */
  follow(event) {
    const link = event.target.closest("a[data-session], #show-all");
    if (!link || event.button !== 0 || event.ctrlKey || event.metaKey || event.shiftKey || event.altKey) return;
    event.preventDefault();
    history.pushState(null, "", link.getAttribute("href"));
    this.choose(link.dataset.session ?? "");
  }

  forget() {
    this.sessions = new Map();
    this.records = [];
    this.lastNumber = 0;
    this.clearRecords();
  }

  /** Begins again with what is shown of the records. */
  clearRecords() {
    this.reportsTable.clear();
    this.filesTable.clear();
    this.chartPanel.clear();
    this.series = new Series();
    this.drawnNumber = 0;
    this.seriesNumber = 0;
  }

  choose(key) {
    this.chosen = key;
    document.title = key ? `Session ${key} · tally-station` : "Sessions · tally-station";
    this.setPaused(false);
    this.clearRecords();
    this.draw();
  }

  setPaused(isPaused) {
    this.isPaused = isPaused;
    this.pauseButton.setAttribute("aria-pressed", String(isPaused));
    setText(this.pauseButton, isPaused ? "Go on" : "Pause");
    this.drawSoon();
  }

  /** @param update  Of the station's: {reset, sessions, records}. */
  take(update) {
    if (update.reset) this.forget();
    this.uncounted = update.uncounted;
    for (const session of update.sessions) this.sessions.set(session.session, session);
    this.boundSessions();
    for (const record of update.records) {
      // All kinds are numbered together: what is left out was not held for this page.
      if (this.lastNumber && record.n > this.lastNumber + 1 && !update.reset) this.missed += record.n - this.lastNumber - 1;
      this.lastNumber = record.n;
      this.records.push(record);
    }
    if (this.records.length > MAXIMUM_RECORDS) this.records.splice(0, this.records.length - MAXIMUM_RECORDS);
    this.drawSoon();
  }

  boundSessions() {
    if (this.sessions.size <= MAXIMUM_SESSIONS) return;
    const byLast = [...this.sessions.values()].sort((a, b) => a.last - b.last);
    for (const session of byLast.slice(0, this.sessions.size - MAXIMUM_SESSIONS)) this.sessions.delete(session.session);
  }

  drawSoon() {
    this.drawTimer ??= setTimeout(() => {
      this.drawTimer = undefined;
      this.draw();
    }, DRAW_EVERY);
  }

  isShown(record) {
    return !this.chosen || record.session === this.chosen;
  }

  draw() {
    this.drawSelection();
    this.sessionsTable.draw(this.sessions, this.chosen);
    if (this.shownSession !== this.chosen && this.sessions.has(this.chosen)) this.sessionsTable.showChosen();
    this.shownSession = this.sessions.has(this.chosen) ? this.chosen : undefined;
    this.deliveryTable.draw(this.sessions, this.chosen);
    this.drawTotals();
    this.drawRecords();
  }

  drawSelection() {
    const session = this.sessions.get(this.chosen);
    const isWaiting = Boolean(this.chosen) && !session;
    this.selection.hidden = !this.chosen;
    document.body.classList.toggle("one-session", Boolean(this.chosen));
    this.selection.classList.toggle("waiting", isWaiting);
    setText(this.selectionTitle, `Session ${this.chosen}`);
    setText(this.selectionNote, isWaiting
      ? "Waiting: nothing has come from this session yet. Its first report appears here by itself."
      : "Its reports only");
  }

  drawTotals() {
    let events = 0;
    let datagrams = 0;
    for (const session of this.sessions.values()) {
      events += session.events.received;
      datagrams += session.datagrams.received;
    }
    const missed = (this.missed ? ` · ${countText(this.missed)} came too fast for this page` : "") +
      (this.uncounted ? ` · ${countText(this.uncounted)} came too fast for the station` : "");
    setText(this.totals, `${countText(this.sessions.size)} sessions · ${countText(events)} events · ` +
      `${countText(datagrams)} datagrams${missed}`);
  }

  drawRecords() {
    const fresh = this.after(this.drawnNumber);
    const isReport = (record) => record.kind === "event" || record.kind === "datagram";
    const reports = fresh.filter((record) => isReport(record) && this.isShown(record));
    setText(this.behind, this.isPaused ? `Paused, ${countText(reports.length)} new` : "");
    if (!this.isPaused) {
      this.reportsTable.add(reports, this.chosen ? "Nothing of this session yet." : "Nothing has been reported yet.");
      this.filesTable.add(fresh.filter((record) => !isReport(record) && this.isShown(record)));
      this.drawnNumber = this.lastNumber;
    }
    this.drawCharts();
  }

  drawCharts() {
    if (this.isPaused) return;
    if (this.chosen) {
      for (const record of this.after(this.seriesNumber)) if (this.isShown(record)) this.series.take(record);
    }
    this.seriesNumber = this.lastNumber;
    this.chartPanel.draw(this.series, this.chosen ? "It has reported no numbers yet."
      : "Choose a session to see its numbers drawn.");
  }

  /** The records with greater numbers. */
  after(number) {
    let start = this.records.length;
    while (start > 0 && this.records[start - 1].n > number) start--;
    return this.records.slice(start);
  }
}

/** Gets what the station has, then what comes. */
class Connection {
  constructor(take) {
    this.take = take;
    this.status = document.getElementById("connection");
    this.position = "";
    document.addEventListener("visibilitychange", () => this.visibilityChanged());
    window.addEventListener("pagehide", () => this.close());
    window.addEventListener("pageshow", (event) => event.persisted && this.open());
  }

  async start() {
    try {
      const response = await fetch("/api/snapshot");
      if (!response.ok) throw new Error(response.statusText);
      this.receive(await response.json());
    } catch {
      // The live connection brings it all the same.
    }
    this.open();
  }

  receive(update) {
    this.position = update.position;
    this.take(update);
  }

  open() {
    this.close();
    this.source = new EventSource(`/live?after=${encodeURIComponent(this.position)}`);
    this.source.onopen = () => this.show("live", "live");
    this.source.onmessage = (event) => this.receive(JSON.parse(event.data));
    this.source.onerror = () => this.failed();
  }

  close() {
    clearTimeout(this.retryTimer);
    this.source?.close();
    this.source = undefined;
  }

  show(state, text) {
    this.status.dataset.state = state;
    setText(this.status, text);
  }

  async failed() {
    this.close();
    this.retryTimer = setTimeout(() => this.open(), RETRY_AFTER);
    let isThere = false;
    try {
      isThere = (await fetch("/sessions", { method: "HEAD" })).ok;
    } catch {
      // It is not.
    }
    if (this.source?.readyState === EventSource.OPEN) return;
    this.show("lost", isThere ? "not live: as many pages are live as may be; trying again"
      : "the station is out of reach; trying again");
  }

  visibilityChanged() {
    clearTimeout(this.hiddenTimer);
    if (document.hidden) {
      this.hiddenTimer = setTimeout(() => {
        this.close();
        this.show("connecting", "asleep while nobody looks");
      }, HIDDEN_FOR);
    } else if (!this.source) {
      this.open();
    }
  }
}

const page = new Page();
new Connection((update) => page.take(update)).start();
