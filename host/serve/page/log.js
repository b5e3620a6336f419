// The device's log, as its filters leave it; what is appended is shown as it comes.

import { byId, element, setText, show } from "./elements.js";
import { ask, Coalesced, deviceUrl } from "./live.js";
import { clock } from "./words.js";

const FILTERS = ["level", "category", "app", "text"];
const SHOWN_LINES = 500; // the older ones go
const TYPING_MS = 200;
const NEAR_PX = 40; // from its end: who reads there wants to see what comes

export class LogView {
  constructor() {
    this.lines = byId("lines");
    this.form = byId("filters");
    this.loading = new Coalesced(() => this.load());
    this.begun = 0; // how often it was shown anew
    this.form.addEventListener("input", () => this.filterSoon());
    this.form.addEventListener("submit", (event) => {
      event.preventDefault();
      this.begin();
    });
    this.form.addEventListener("reset", () => setTimeout(() => this.begin()));
  }

  open(name) {
    this.name = name;
    return this.begin();
  }

  close() {
    this.name = null;
    this.form.reset();
  }

  showApplication(identifier) {
    this.form.reset();
    this.form.elements.app.value = identifier;
    this.begin();
    byId("log").scrollIntoView({ block: "start" });
    this.lines.focus({ preventScroll: true });
  }

  filterSoon() {
    clearTimeout(this.timer);
    this.timer = setTimeout(() => this.begin(), TYPING_MS);
  }

  // Shows the log anew, as when a filter has changed.
  begin() {
    clearTimeout(this.timer);
    this.next = null;
    this.begun += 1;
    return this.more();
  }

  more() {
    return this.loading.run();
  }

  async load() {
    const { name, next, begun } = this;
    if (!name) return;
    const answer = await ask(deviceUrl(name, `/log?${this.query()}`)).catch((error) => ({ lines: null, message: error.message }));
    if (name !== this.name || begun !== this.begun) return;
    if (!answer.lines) {
      this.refuse(answer.message);
      return;
    }
    this.next = answer.next;
    this.add(answer.lines, next === null);
    // There may be more; only the last of them are shown.
    if (next !== null && answer.lines.length === SHOWN_LINES) this.begin();
  }

  query() {
    const query = new URLSearchParams({ limit: SHOWN_LINES });
    for (const key of FILTERS) {
      const value = this.form.elements[key].value.trim();
      if (value) query.set(key, value);
    }
    if (this.next !== null && this.next !== undefined) query.set("after", this.next);
    return query;
  }

  add(lines, isNew) {
    const isAtEnd = isNew || this.lines.scrollHeight - this.lines.scrollTop - this.lines.clientHeight < NEAR_PX;
    const fragment = document.createDocumentFragment();
    fragment.append(...lines.map(logLine));
    if (isNew) this.lines.replaceChildren(fragment);
    else this.lines.append(fragment);
    while (this.lines.childElementCount > SHOWN_LINES) this.lines.firstElementChild.remove();
    if (isAtEnd) this.lines.scrollTop = this.lines.scrollHeight;
    const isFiltered = FILTERS.some((key) => this.form.elements[key].value.trim() !== "");
    this.tellLength(isFiltered ? "No line of the log is like that." : "The log is empty.");
  }

  refuse(message) {
    this.lines.replaceChildren();
    this.tellLength(message);
  }

  tellLength(whyNone) {
    const length = this.lines.childElementCount;
    show(this.lines, length > 0);
    show(byId("no-lines"), length === 0);
    setText(byId("no-lines"), whyNone);
    setText(byId("log-badge"), length < SHOWN_LINES ? `${length} lines` : `last ${length} lines`);
  }
}

function logLine(line) {
  return element("p", { class: "line", "data-level": line.level },
    element("time", { datetime: line.time }, clock(line.time)),
    element("span", { class: "level" }, line.level),
    element("span", { class: "category" }, String(line.category)),
    element("span", { class: "message" }, line.message));
}
