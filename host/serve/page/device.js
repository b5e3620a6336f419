// A device: what stands in its head, its home screen, session, coordinators and log, kept as the device is.

import { ApplicationPanel } from "./application.js";
import { arrange, byId, element, setAttribute, setText, show } from "./elements.js";
import { HomeScreen } from "./home-screen.js";
import { ask, Coalesced, deviceUrl } from "./live.js";
import { LogView } from "./log.js";
import { DeviceModel } from "./model.js";
import { SessionView } from "./session.js";
import { count, deviceState, percent, size } from "./words.js";

export class DeviceView {
  constructor(navigate, tell) {
    this.tell = tell;
    this.navigate = navigate;
    this.screen = new HomeScreen((identifier) => navigate(this.model.name, identifier));
    this.panel = new ApplicationPanel(() => this.closeApplication(), (identifier) => this.log.showApplication(identifier));
    this.session = new SessionView((identifier) => navigate(this.model.name, identifier));
    this.log = new LogView();
    this.loading = new Coalesced(() => this.load());
    this.model = null;
    this.chosen = null;
  }

  open(name) {
    this.close();
    this.model = new DeviceModel(name);
    setText(byId("device-name"), name);
    this.log.open(name);
  }

  close() {
    this.model = null;
    this.chosen = null;
    this.spoken = "";
    this.screen.clear();
    this.session.clear();
    this.panel.close();
    this.log.close();
  }

  // Something on the disk is another than before.
  changed(event) {
    if (!event.changed || event.changed.includes("log")) this.log.more();
    return this.loading.run();
  }

  async load() {
    const model = this.model;
    if (!model) return;
    const since = model.stamp === null ? "" : `?since=${encodeURIComponent(model.stamp)}`;
    try {
      const answer = await ask(deviceUrl(model.name, since));
      if (model !== this.model) return;
      this.draw(model.take(answer));
      if (since === "") performance.mark("drawn");
      this.tell("");
    } catch (error) {
      if (model === this.model) this.tell(error.message);
    }
  }

  draw(changed) {
    const model = this.model;
    setText(byId("device-state"), deviceState(model.state));
    setAttribute(byId("device-state"), "data-state", model.state);
    setAttribute(byId("device"), "data-state", model.state);
    drawFacts(model);
    this.screen.update(model, changed);
    this.session.update(model);
    drawCoordinators(model);
    this.tellState();
    if (this.chosen) this.panel.open(model, this.chosen);
  }

  // For who listens instead of looking: only what is new, and not each per cent.
  tellState() {
    const { state, message, session } = this.model;
    const waiting = this.model.waiting().map((each) => each.name);
    const waits = waiting.length > 0 ? ` ${waiting.slice(0, 3).join(", ")} ${waiting.length === 1 ? "waits" : "wait"}.` : "";
    const text = `${message || deviceState(state)}.${session?.running ? waits : ""}`;
    if (text === this.spoken) return;
    this.spoken = text;
    setText(byId("spoken"), text);
  }

  choose(identifier) {
    if (identifier === this.chosen) return;
    const before = this.chosen;
    this.chosen = identifier;
    this.screen.choose(identifier);
    if (identifier) {
      this.panel.open(this.model, identifier);
    } else {
      this.panel.close();
      this.screen.focus(before);
    }
  }

  closeApplication() {
    if (this.chosen) this.navigate(this.model.name, null);
  }
}

function drawFacts(model) {
  const facts = factsOf(model).map(([what, value]) =>
    element("div", {}, element("dt", {}, what), element("dd", {}, value)));
  const text = JSON.stringify(factsOf(model));
  if (byId("facts").dataset.shown === text) return;
  byId("facts").dataset.shown = text;
  arrange(byId("facts"), facts);
}

function factsOf(model) {
  const status = model.status;
  if (!status) return model.message ? [["State", model.message]] : [];
  const facts = [["Installed", String(status.installed)]];
  for (const kind of ["arriving", "restored", "offloaded"]) {
    if (status[kind]) facts.push([kind[0].toUpperCase() + kind.slice(1), String(status[kind])]);
  }
  if (status.running.length > 0) facts.push(["Running", String(status.running.length)]);
  facts.push(["Installs", status.coordination === "on" ? "coordinated" : "direct"]);
  for (const kind of ["installation", "removal"]) {
    if (status[kind] === "no") facts.push([kind[0].toUpperCase() + kind.slice(1), "forbidden"]);
  }
  if (status.kept) facts.push(["Kept versions", String(status.kept)]);
  facts.push(["Free", size(status.free)]);
  return facts;
}

function drawCoordinators(model) {
  const list = byId("coordinator-list");
  const text = JSON.stringify(model.coordinators);
  show(byId("no-coordinators"), model.coordinators.length === 0);
  setText(byId("coordinators-badge"), model.coordinators.length > 0 ? count(model.coordinators.length, "install") : "none");
  if (list.dataset.shown === text) return;
  list.dataset.shown = text;
  list.replaceChildren(...model.coordinators.map(coordinatorItem));
}

function coordinatorItem(coordinator) {
  const promises = coordinator.promises.map((promise) =>
    element("li", { class: promise.complete ? "kept" : "open" },
      element("span", { class: "promise" }, promise.name),
      element("span", {}, promise.complete ? "kept" : percent(promise.percent))));
  return element("li", {},
    element("p", { class: "coordinator-head" },
      element("strong", {}, coordinator.identifier),
      element("span", { class: "aside" }, `${coordinator.kind}, client ${coordinator.client}`)),
    element("p", {}, coordinator.state),
    element("ul", { class: "promises" }, ...promises));
}
