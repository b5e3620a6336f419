// All devices of a folder: a card each.

import { arrange, byId, element, setAttribute, setText, show } from "./elements.js";
import { clock, count, deviceState } from "./words.js";

export class Overview {
  constructor() {
    this.cards = new Map();
  }

  update(devices, leftOut) {
    const nodes = devices.map((device) => this.card(device).item);
    const names = new Set(devices.map((device) => device.name));
    for (const name of this.cards.keys()) {
      if (!names.has(name)) this.cards.delete(name);
    }
    arrange(byId("cards"), nodes);
    show(byId("no-devices"), devices.length === 0);
    show(byId("left-out"), leftOut > 0);
    if (leftOut > 0) {
      const those = leftOut === 1 ? "1 more device stands" : `${count(leftOut, "more device")} stand`;
      setText(byId("left-out"), `${those} in this folder, and at most ${devices.length} are shown at once.`);
    }
  }

  card(device) {
    let card = this.cards.get(device.name);
    if (!card) {
      card = new Card(device.name);
      this.cards.set(device.name, card);
    }
    card.update(device);
    return card;
  }
}

class Card {
  constructor(name) {
    this.badge = element("span", { class: "badge" });
    this.counts = element("p", { class: "card-counts" });
    this.bar = element("progress", { "aria-label": `The session of ${name}`, hidden: true });
    this.about = element("p", { class: "aside" });
    const head = element("span", { class: "card-head" }, element("h2", {}, name), this.badge);
    this.link = element("a", { class: "card", href: `#/${encodeURIComponent(name)}` }, head, this.counts, this.bar, this.about);
    this.item = element("li", {}, this.link);
  }

  update(device) {
    setText(this.badge, deviceState(device.state));
    setAttribute(this.badge, "data-state", device.state);
    setAttribute(this.link, "data-state", device.state);
    setText(this.counts, device.state === "damaged" || device.state === "gone" ? device.message : countsOf(device));
    const { session } = device;
    show(this.bar, Boolean(session?.running));
    setAttribute(this.bar, "max", session?.total || null);
    setAttribute(this.bar, "value", session?.total ? session.done ?? 0 : null);
    setText(this.about, aboutSession(session));
  }
}

function countsOf(device) {
  const parts = [count(device.applications, "application")];
  if (device.placeholders) parts.push(count(device.placeholders, "placeholder"));
  if (device.installing) parts.push(`${device.installing} being installed`);
  return parts.join(" · ");
}

function aboutSession(session) {
  if (!session) return "";
  if (!session.running) return "the last session was interrupted";
  return session.began ? `session since ${clock(session.began)}` : "session under way";
}
