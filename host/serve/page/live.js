// What the server tells: answers, and events that say when to ask again.

const RETRY_MS = 1000;

export const deviceUrl = (name, rest = "") => `/api/device/${encodeURIComponent(name)}${rest}`;

export async function ask(url) {
  const response = await fetch(url, { headers: { Accept: "application/json" } });
  const answer = await response.json().catch(() => ({}));
  if (!response.ok) throw new Error(answer.message ?? `The server answers with ${response.status}.`);
  return answer;
}

// Calls `onChange` for each event of `url`, and `onState` with "live" or "gone". While nobody looks at the page
// the connection is given back: a browser has few of them for one server.
export class Live {
  constructor(url, onChange, onState) {
    this.url = url;
    this.onChange = onChange;
    this.onState = onState;
    this.onVisibility = () => (document.hidden ? this.close() : this.open());
    document.addEventListener("visibilitychange", this.onVisibility);
    this.open();
  }

  open() {
    this.close();
    this.source = new EventSource(this.url);
    this.source.addEventListener("open", () => this.onState("live"));
    this.source.addEventListener("device", (event) => this.onChange(JSON.parse(event.data)));
    this.source.addEventListener("error", () => this.tryAgain());
  }

  // Also a server that is there may have no such events, or too many readers at this moment.
  async tryAgain() {
    this.close();
    this.timer = setTimeout(() => this.open(), RETRY_MS);
    const { timer } = this;
    const state = await ask("/api/devices").then(() => "connecting", () => "gone");
    if (timer === this.timer && this.source?.readyState !== EventSource.OPEN) this.onState(state);
  }

  close() {
    clearTimeout(this.timer);
    this.timer = null;
    this.source?.close();
    this.source = null;
  }

  end() {
    document.removeEventListener("visibilitychange", this.onVisibility);
    this.close();
  }
}

// Runs `task` when it is asked to, never twice at once; who asks meanwhile gets one more run.
export class Coalesced {
  constructor(task) {
    this.task = task;
    this.isBusy = false;
    this.isWanted = false;
  }

  async run() {
    this.isWanted = true;
    if (this.isBusy) return;
    this.isBusy = true;
    try {
      while (this.isWanted) {
        this.isWanted = false;
        await this.task();
      }
    } finally {
      this.isBusy = false;
    }
  }
}
