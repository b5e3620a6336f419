// One application: what it waits for, its versions, its history.

import { byId, element, show } from "./elements.js";
import { iconOf } from "./icon.js";
import { ask, Coalesced, deviceUrl } from "./live.js";
import { applicationState, clock, installType, size } from "./words.js";

const ABSENT = { text: "The device has nothing of it." };
const HISTORY_LENGTH = 8; // entries that are shown until all are asked for

export class ApplicationPanel {
  constructor(onClose, onLog) {
    this.root = byId("application");
    this.onClose = onClose;
    this.onLog = onLog;
    this.loading = new Coalesced(() => this.load());
    this.identifier = null;
  }

  open(model, identifier) {
    const isNew = this.identifier !== identifier || this.model !== model;
    this.model = model;
    this.identifier = identifier;
    if (!isNew) return this.refresh();
    this.why = null;
    this.history = [];
    this.showsAll = false;
    this.draw();
    show(this.root, true);
    this.root.focus({ preventScroll: true });
    return this.refresh();
  }

  close() {
    this.identifier = null;
    this.root.replaceChildren();
    show(this.root, false);
  }

  refresh() {
    return this.identifier ? this.loading.run() : undefined;
  }

  async load() {
    const { model, identifier } = this;
    if (!identifier || model.stamp === null) return;
    const id = encodeURIComponent(identifier);
    const isThere = model.applications.has(identifier);
    const [why, history] = await Promise.all([
      isThere ? ask(deviceUrl(model.name, `/why/${id}`)).catch((error) => ({ text: error.message })) : ABSENT,
      ask(deviceUrl(model.name, `/history/${id}`)).catch(() => []),
    ]);
    if (this.identifier !== identifier || this.model !== model) return;
    const text = JSON.stringify([why, history, model.applications.get(identifier)]);
    if (text === this.drawn) return;
    this.why = why;
    this.history = Array.isArray(history) ? history : [];
    this.draw();
    this.drawn = text;
  }

  draw() {
    this.drawn = null;
    const focused = this.root.contains(document.activeElement) ? document.activeElement.id : null;
    const application = this.model.applications.get(this.identifier);
    this.root.replaceChildren(
      this.head(application),
      whyPart(this.why),
      versionsPart(application),
      this.historyPart(),
    );
    if (focused) byId(focused)?.focus({ preventScroll: true });
  }

  head(application) {
    const close = element("button", { class: "quiet close", id: "close-application", type: "button", "aria-label": "Close" }, "×");
    close.addEventListener("click", () => this.onClose());
    const log = element("button", { class: "quiet", id: "its-log", type: "button" }, "Its lines in the log");
    log.addEventListener("click", () => this.onLog(this.identifier));
    const name = application?.name ?? this.identifier;
    return element("div", { class: "application-head" },
      element("span", { class: "icon large" }, iconOf(application ?? { name, icon: null })),
      element("div", { class: "application-title" },
        element("h2", { id: "application-name" }, name),
        element("p", { class: "identifier" }, this.identifier),
        element("p", { class: "application-state" }, application ? applicationState(application) : "not on the device")),
      log, close);
  }

  historyPart() {
    const newestFirst = [...this.history].reverse();
    const shown = this.showsAll ? newestFirst : newestFirst.slice(0, HISTORY_LENGTH);
    const list = element("ol", { class: "history" }, ...shown.map(historyEntry));
    const more = newestFirst.length > shown.length ? this.moreButton(newestFirst.length) : null;
    const none = newestFirst.length === 0 ? element("p", { class: "empty" }, "The device remembers nothing of it.") : null;
    return element("div", { class: "part" }, element("h3", {}, "History"), none, list, more);
  }

  moreButton(length) {
    const button = element("button", { class: "quiet", id: "all-history", type: "button" }, `All ${length}`);
    button.addEventListener("click", () => {
      this.showsAll = true;
      this.draw();
    });
    return button;
  }
}

// What `why` says; the commands in it are set apart.
function whyPart(why) {
  const lines = why ? why.text.trim().split("\n") : ["…"];
  const paragraphs = lines.map((line) => element("p", {}, ...withCommands(line)));
  return element("div", { class: "part why", id: "why" }, element("h3", {}, "Why"), ...paragraphs);
}

export function withCommands(line) {
  return line.split(/(appsync [^)]*)(?=\))/).map((piece, index) => (index % 2 ? element("code", {}, piece) : piece));
}

function versionsPart(application) {
  const rows = [];
  const { installed, placeholder } = application ?? {};
  if (installed) {
    rows.push(row("Installed", installed.version ?? "–", size(installed.bytes)));
    if (installed.kept) rows.push(row("Kept for a rollback", installed.kept.version ?? "–", size(installed.kept.bytes)));
  }
  if (placeholder) rows.push(row(`Placeholder${placeholder.placeholder ? `, ${placeholder.placeholder}` : ""}`, placeholder.version ?? "–", ""));
  const record = installed ?? placeholder;
  const came = record ? element("p", { class: "aside" }, `${record.type} application, ${installed ? "came" : "comes"} by ${installType(record.installType)}`) : null;
  return element("div", { class: "part versions" }, element("h3", {}, "Versions"), element("table", {}, element("tbody", {}, ...rows)), came);
}

function row(what, version, bytes) {
  return element("tr", {}, element("th", { scope: "row" }, what), element("td", { class: "version" }, version), element("td", {}, bytes));
}

function historyEntry(entry) {
  return element("li", { class: entry.success ? "good" : "bad" },
    element("time", { datetime: entry.time }, clock(entry.time)),
    element("span", { class: "what" }, entry.scenario || (entry.phase === 1 ? "begins" : "ends")),
    element("span", {}, entry.description),
    entry.success ? null : element("span", { class: "failed" }, "failed"));
}
