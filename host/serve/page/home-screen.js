// The home screen: a button for each application, reached by the arrow keys; only what has changed is touched.

import { arrange, byId, element, setAttribute, setText, shape, show } from "./elements.js";
import { iconOf } from "./icon.js";
import { applicationState, count } from "./words.js";

const CIRCLE = 100; // the length of the ring, whatever its radius

export class HomeScreen {
  constructor(onChoose) {
    this.onChoose = onChoose;
    this.tiles = new Map();
    this.groups = [byId("icons"), byId("elsewhere")];
    this.find = byId("find");
    for (const group of this.groups) {
      group.addEventListener("click", (event) => this.clicked(event));
      group.addEventListener("keydown", (event) => this.moved(event, group));
      group.addEventListener("focusin", (event) => this.focused(event, group));
    }
    this.find.addEventListener("input", () => this.filter());
    this.find.addEventListener("keydown", (event) => this.findKey(event));
  }

  clear() {
    this.tiles.clear();
    this.find.value = "";
    for (const group of this.groups) group.replaceChildren();
  }

  update(model, changed) {
    for (const identifier of changed) this.updateTile(model, identifier);
    const lists = [model.onScreen(), model.elsewhere()];
    const focused = document.activeElement; // what is moved loses it
    lists.forEach((list, index) => {
      arrange(this.groups[index], list.map((identifier) => this.tiles.get(identifier).button));
      keepOneReachable(this.groups[index]);
    });
    if (focused !== document.activeElement && focused.isConnected) focused.focus({ preventScroll: true });
    show(byId("no-icons"), lists[0].length === 0);
    for (const id of ["elsewhere", "elsewhere-title"]) show(byId(id), lists[1].length > 0);
    this.filter();
  }

  updateTile(model, identifier) {
    const application = model.applications.get(identifier);
    if (!application) {
      this.tiles.delete(identifier);
      return;
    }
    let tile = this.tiles.get(identifier);
    if (!tile) {
      tile = new Tile(identifier);
      this.tiles.set(identifier, tile);
    }
    tile.update(application);
  }

  choose(identifier) {
    for (const [each, tile] of this.tiles) {
      setAttribute(tile.button, "aria-pressed", each === identifier ? "true" : null);
    }
  }

  focus(identifier) {
    (this.tiles.get(identifier)?.button ?? this.groups[0].querySelector("[tabindex='0']"))?.focus();
  }

  // Leaves those whose name or identifier holds what is looked for.
  filter() {
    const wanted = this.find.value.trim().toLowerCase();
    let found = 0;
    for (const tile of this.tiles.values()) {
      const isFound = tile.text.includes(wanted);
      show(tile.button, isFound);
      found += isFound ? 1 : 0;
    }
    const all = this.tiles.size;
    setText(byId("count"), wanted ? `${found} of ${all}` : count(all, "application"));
    if (wanted) this.groups.forEach(keepOneReachable);
  }

  findKey(event) {
    if (event.key === "Escape" && this.find.value) {
      this.find.value = "";
      this.filter();
      event.stopPropagation();
    } else if (event.key === "Enter" || event.key === "ArrowDown") {
      event.preventDefault();
      this.groups.flatMap(shownButtons)[0]?.focus();
    }
  }

  clicked(event) {
    const button = event.target.closest(".app");
    if (button) this.onChoose(button.dataset.identifier);
  }

  focused(event, group) {
    if (event.target.matches(".app")) makeReachable(group, event.target);
  }

  moved(event, group) {
    const buttons = shownButtons(group);
    const step = stepOf(event.key, group, buttons.length);
    if (step === null) return;
    event.preventDefault();
    const index = buttons.indexOf(document.activeElement) + step;
    const target = buttons[Math.min(Math.max(index, 0), buttons.length - 1)];
    target?.focus();
  }
}

class Tile {
  constructor(identifier) {
    this.picture = null;
    this.icon = element("span", { class: "icon" });
    this.name = element("span", { class: "name" });
    this.button = element("button", { class: "app", type: "button", tabindex: "-1" }, this.icon, this.name);
    this.button.dataset.identifier = identifier;
  }

  update(application) {
    this.text = `${application.name}\n${application.identifier}`.toLowerCase();
    setText(this.name, application.name);
    setAttribute(this.button, "title", application.identifier);
    setAttribute(this.button, "aria-label", `${application.name}, ${applicationState(application)}`);
    setAttribute(this.button, "data-state", application.placeholder ? "placeholder" : "installed");
    setAttribute(this.button, "data-placeholder", application.placeholderKind);
    setAttribute(this.button, "data-waiting", application.waitingFor ? "yes" : null);
    setAttribute(this.button, "data-running", application.running ? "yes" : null);
    this.updatePicture(application);
    this.updateRing(application.progress);
  }

  updatePicture(application) {
    if (application.icon === this.shownIcon && this.icon.firstChild) return;
    this.shownIcon = application.icon;
    const picture = iconOf(application);
    if (this.picture) this.picture.replaceWith(picture);
    else this.icon.prepend(picture);
    this.picture = picture;
  }

  updateRing(progress) {
    if (progress === null) {
      this.ring?.remove();
      this.ring = null;
      return;
    }
    if (!this.ring) {
      this.ring = ring();
      this.icon.append(this.ring);
    }
    setAttribute(this.ring.lastChild, "stroke-dasharray", `${Math.round(progress * CIRCLE)} ${CIRCLE}`);
  }
}

function ring() {
  const circle = (name) => shape("circle", { class: name, cx: 20, cy: 20, r: 15, pathLength: CIRCLE });
  return shape("svg", { class: "ring", viewBox: "0 0 40 40", "aria-hidden": "true" }, circle("track"), circle("done"));
}

const shownButtons = (group) => [...group.children].filter((button) => !button.hidden);

function keepOneReachable(group) {
  const reachable = group.querySelector(".app[tabindex='0']");
  if (reachable && !reachable.hidden) return;
  const first = shownButtons(group)[0];
  if (first) makeReachable(group, first);
}

function makeReachable(group, button) {
  for (const other of group.querySelectorAll(".app[tabindex='0']")) {
    if (other !== button) other.tabIndex = -1;
  }
  if (button.tabIndex !== 0) button.tabIndex = 0;
}

function stepOf(key, group, length) {
  const columns = getComputedStyle(group).gridTemplateColumns.split(" ").length;
  const steps = {
    ArrowLeft: -1, ArrowRight: 1, ArrowUp: -columns, ArrowDown: columns, Home: -length, End: length,
  };
  return steps[key] ?? null;
}
