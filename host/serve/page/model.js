// A device as the page knows it: the last whole answer of the server, and what has changed since.

export class DeviceModel {
  constructor(name) {
    this.name = name;
    this.stamp = null;
    this.state = "idle";
    this.message = "";
    this.applications = new Map();
    this.screen = [];
    this.coordinators = [];
    this.session = null;
    this.status = null;
    this.timeline = null;
  }

  // Takes an answer; gives the identifiers of which something has changed.
  take(answer) {
    const isWhole = this.stamp === null || answer.whole !== false;
    const records = grouped(answer.applications ?? []);
    const changed = new Set(records.keys());
    if (isWhole) {
      for (const identifier of this.applications.keys()) changed.add(identifier);
      this.applications.clear();
    }
    for (const identifier of answer.gone ?? []) {
      this.applications.delete(identifier);
      changed.add(identifier);
    }
    for (const [identifier, some] of records) this.applications.set(identifier, application(identifier, some));
    for (const key of ["stamp", "state", "message", "screen", "coordinators", "session", "status", "timeline"]) {
      if (answer[key] !== undefined) this[key] = answer[key];
    }
    return changed;
  }

  onScreen() {
    return this.screen.filter((identifier) => this.applications.has(identifier));
  }

  elsewhere() {
    const shown = new Set(this.screen);
    return [...this.applications.keys()].filter((identifier) => !shown.has(identifier));
  }

  waiting() {
    return [...this.applications.values()].filter((each) => each.waitingFor);
  }

  installing() {
    return [...this.applications.values()].filter((each) => each.progress !== null);
  }
}

// An update under way has two records, of the application and of its placeholder.
function grouped(records) {
  const byIdentifier = new Map();
  for (const record of records) {
    const some = byIdentifier.get(record.identifier);
    if (some) some.push(record);
    else byIdentifier.set(record.identifier, [record]);
  }
  return byIdentifier;
}

function application(identifier, records) {
  const installed = records.find((record) => record.state === "installed") ?? null;
  const placeholder = records.find((record) => record.state === "placeholder") ?? null;
  const first = (key) => records.map((record) => record[key]).find((value) => value !== null && value !== undefined);
  return {
    identifier,
    installed,
    placeholder,
    name: first("name") || identifier,
    icon: first("icon") ?? null,
    progress: first("progress") ?? null,
    waitingFor: first("waitingFor") ?? null,
    running: Boolean(first("running")),
    placeholderKind: placeholder?.placeholder ?? null,
  };
}
