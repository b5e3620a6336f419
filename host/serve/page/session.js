// The session under way, or the last one: how far it is, what waits for whom, and its timeline as it grows.

import { arrange, byId, element, setAttribute, setText, show } from "./elements.js";
import { withCommands } from "./application.js";
import { clock, count, phase, waitSentence } from "./words.js";

const PICTURE_MS = 1000; // between two looks at the timeline of a session that goes on

export class SessionView {
  constructor(onChoose) {
    this.onChoose = onChoose;
    this.waits = new Map();
    this.picture = byId("timeline-picture");
  }

  clear() {
    clearTimeout(this.timer);
    this.timer = null;
    this.shownPicture = null;
    this.waits.clear();
    byId("waits").replaceChildren();
    show(byId("timeline"), false);
  }

  update(model) {
    const session = model.session;
    const isRunning = Boolean(session?.running);
    setText(byId("session-badge"), isRunning ? "under way" : badge(model));
    setAttribute(byId("session-badge"), "data-state", isRunning ? "syncing" : "idle");
    setText(byId("session-text"), sessionText(model));
    updateBar(session);
    this.updateWaits(model.waiting());
    this.updateTimeline(model, isRunning);
  }

  updateWaits(applications) {
    const items = applications.map((application) => this.waitItem(application));
    const wanted = new Set(applications.map((each) => each.identifier));
    for (const identifier of this.waits.keys()) {
      if (!wanted.has(identifier)) this.waits.delete(identifier);
    }
    arrange(byId("waits"), items);
  }

  waitItem(application) {
    const text = waitSentence(application.waitingFor);
    const known = this.waits.get(application.identifier);
    if (known?.text === text && known.name === application.name) return known.item;
    const button = element("button", { class: "link", type: "button" }, application.name);
    button.addEventListener("click", () => this.onChoose(application.identifier));
    const item = element("li", {}, button, " ", ...withCommands(text));
    this.waits.set(application.identifier, { text, name: application.name, item });
    return item;
  }

  // The next picture comes in the place of the shown one when it is there whole.
  updateTimeline(model, isRunning) {
    this.wanted = model.timeline;
    if (!this.wanted) {
      show(byId("timeline"), false);
      return;
    }
    const url = `${this.wanted}${this.wanted.includes("?") ? "&" : "?"}at=${model.stamp}`;
    if (url === this.shownPicture || this.timer) return;
    this.load(url);
    if (!isRunning) return;
    this.timer = setTimeout(() => {
      this.timer = null;
      this.updateTimeline(model, Boolean(model.session?.running));
    }, PICTURE_MS);
  }

  load(url) {
    this.shownPicture = url;
    const next = new Image();
    next.addEventListener("load", () => {
      if (this.shownPicture !== url || !this.wanted) return;
      this.picture.src = url;
      byId("timeline-link").href = this.wanted;
      show(byId("timeline"), true);
    });
    // The device cannot be read at this moment.
    next.addEventListener("error", () => setTimeout(() => this.shownPicture === url && this.wanted && this.load(url), PICTURE_MS));
    next.src = url;
  }
}

const wasInterrupted = (model) => model.status?.session === "interrupted";

// A device that cannot be read tells nothing of its sessions.
const isUnknown = (model) => !model.status && model.state !== "idle";

function badge(model) {
  if (isUnknown(model)) return "unknown";
  return wasInterrupted(model) ? "interrupted" : "none under way";
}

function sessionText(model) {
  const session = model.session;
  if (session?.running) {
    const steps = session.total ? `: ${session.done} of ${count(session.total, "application")}` : "";
    return `${phase(session.phase)}${steps}${session.began ? `, since ${clock(session.began)}` : ""}.`;
  }
  if (isUnknown(model)) return "The device cannot be read.";
  if (wasInterrupted(model)) {
    return "The last session was interrupted; the same command, run again, brings the device in step.";
  }
  return model.timeline ? "The last session went like this:" : "No session has been held here yet.";
}

function updateBar(session) {
  const bar = byId("session-progress");
  show(bar, Boolean(session?.running));
  setAttribute(bar, "max", session?.total || null);
  setAttribute(bar, "value", session?.total ? session.done ?? 0 : null);
}
