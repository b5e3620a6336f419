// The page: which view is shown, and what keeps it as the devices are.

import { DeviceView } from "./device.js";
import { byId, setAttribute, setText, show } from "./elements.js";
import { ask, Coalesced, deviceUrl, Live } from "./live.js";
import { Overview } from "./overview.js";

const THEMES = ["auto", "light", "dark"];
const CONNECTION = { connecting: "connecting", live: "live", gone: "The server is gone; trying again" };

class Page {
  constructor() {
    this.overview = new Overview();
    this.device = new DeviceView((name, identifier) => go(name, identifier), (message) => this.tell(message));
    this.listing = new Coalesced(() => this.list());
    this.isFolder = true;
    this.known = new Set(); // names of devices
    this.name = undefined; // of the device that is shown; null: all of them
  }

  async start() {
    window.addEventListener("hashchange", () => this.route());
    document.addEventListener("keydown", (event) => this.key(event));
    byId("skip").addEventListener("click", (event) => {
      event.preventDefault();
      byId("main").focus();
    });
    chooseTheme();
    await this.begin();
  }

  // Finds out whether there is one device or a folder of them; until the server answers, again and again.
  async begin() {
    try {
      const { devices, folder } = await ask("/api/devices");
      this.isFolder = folder ?? devices.length !== 1;
      this.only = this.isFolder ? null : devices[0]?.name;
      this.known = new Set(devices.map((device) => device.name));
      this.route();
    } catch (error) {
      this.connection("gone");
      this.tell(error.message);
      setTimeout(() => this.begin(), 1000);
    }
  }

  route() {
    const [name, identifier] = placeNow();
    const wanted = name ?? this.only ?? null;
    const isKnown = wanted === null || this.known.has(wanted);
    const shown = isKnown ? wanted : null;
    if (shown !== this.name) this.showDevice(shown);
    if (shown === null) this.tell(isKnown ? "" : `There is no device called ${wanted} here.`);
    if (shown) this.device.choose(identifier ?? null);
  }

  showDevice(name) {
    this.live?.end();
    this.tell("");
    this.name = name;
    if (name) this.device.open(name);
    else this.device.close();
    show(byId("overview"), name === null);
    show(byId("device"), name !== null);
    show(byId("here"), name !== null);
    setText(byId("here"), name ?? "");
    document.title = name ? `${name} – appsync` : "appsync";
    const url = name ? deviceUrl(name, "/events") : "/api/events";
    this.refresh({});
    this.live = new Live(url, (event) => this.refresh(event), (state) => this.connection(state));
  }

  refresh(event) {
    return this.name ? this.device.changed(event) : this.listing.run();
  }

  async list() {
    try {
      const { devices, leftOut } = await ask("/api/devices");
      if (this.name !== null) return;
      this.known = new Set(devices.map((device) => device.name));
      this.overview.update(devices, leftOut);
      this.route(); // what was asked for may be there now
    } catch (error) {
      this.tell(error.message);
    }
  }

  connection(state) {
    setAttribute(byId("connection"), "data-state", state);
    setText(byId("connection"), CONNECTION[state]);
    setAttribute(document.body, "data-connection", state);
    if (state === "gone") this.wasGone = true;
    if (state !== "live" || !this.wasGone) return;
    this.wasGone = false;
    this.refresh({});
  }

  tell(message) {
    setText(byId("notice"), message);
    show(byId("notice"), message !== "");
  }

  key(event) {
    const isTyping = event.target.matches("input, select, textarea");
    if (event.key === "Escape" && this.name) {
      this.device.closeApplication();
    } else if (event.key === "/" && !isTyping && this.name) {
      event.preventDefault();
      byId("find").focus();
    }
  }
}

// "#/NAME/ID", each part as a URL has it.
function placeNow() {
  return location.hash.replace(/^#\/?/, "").split("/").filter((part) => part !== "").map(decoded);
}

function decoded(part) {
  try {
    return decodeURIComponent(part);
  } catch {
    return part;
  }
}

function go(name, identifier) {
  const parts = [name, identifier].filter((part) => part !== null && part !== undefined);
  location.hash = `#/${parts.map(encodeURIComponent).join("/")}`;
}

// Light, dark, or as the system has it; kept for the next time.
function chooseTheme() {
  const button = byId("theme");
  let theme = THEMES.includes(localStorage.getItem("theme")) ? localStorage.getItem("theme") : THEMES[0];
  const apply = () => {
    setAttribute(document.documentElement, "data-theme", theme === "auto" ? null : theme);
    setText(button, theme[0].toUpperCase() + theme.slice(1));
    setAttribute(button, "aria-label", `Colours: ${theme}`);
  };
  button.addEventListener("click", () => {
    theme = THEMES[(THEMES.indexOf(theme) + 1) % THEMES.length];
    localStorage.setItem("theme", theme);
    apply();
  });
  apply();
}

new Page().start();
