// How values read: times, sizes, counts, and what the codes of a device mean.

const UNITS = ["bytes", "KiB", "MiB", "GiB", "TiB"];

export function size(bytes) {
  if (bytes === null || bytes === undefined) return "–";
  let unit = 0;
  while (bytes >= 1024 && unit < UNITS.length - 1) {
    bytes /= 1024;
    unit += 1;
  }
  return unit === 0 ? `${bytes} bytes` : `${bytes.toFixed(1)} ${UNITS[unit]}`;
}

export function clock(time) {
  const date = new Date(time);
  if (Number.isNaN(date.getTime())) return "–";
  const hours = [date.getHours(), date.getMinutes(), date.getSeconds()].map(two).join(":");
  return day(date) === day(new Date()) ? hours : `${day(date)} ${hours}`;
}

const two = (number) => String(number).padStart(2, "0");
const day = (date) => [date.getFullYear(), two(date.getMonth() + 1), two(date.getDate())].join("-");

export function count(number, one, many = `${one}s`) {
  return number === 1 ? `1 ${one}` : `${number.toLocaleString("en")} ${many}`;
}

export const percent = (fraction) => `${Math.floor(fraction * 100)} %`;

const INSTALL_TYPES = [
  "unknown", "a download from the store", "a restore", "an automatic download", "a sync", "an automatic update",
  "a migration", "offloaded by the system", "offloaded by a person",
];

export const installType = (code) => INSTALL_TYPES[code] ?? String(code);

const DEVICE_STATES = {
  idle: "idle",
  syncing: "a session is under way",
  locked: "locked",
  damaged: "damaged",
  gone: "gone",
};

export const deviceState = (state) => DEVICE_STATES[state] ?? state;

const PHASES = {
  prepare: "It is being prepared",
  transfer: "Packages travel",
  install: "Applications are installed",
  remove: "Applications are removed",
  wait: "It waits",
};

export const phase = (name) => PHASES[name] ?? "A session is under way";

// What an application is at this moment, in a few words.
export function applicationState(application) {
  const waits = application.waitingFor ? ", waiting" : "";
  if (application.progress !== null) {
    return `${percent(application.progress)} ${application.installed ? "updated" : "installed"}${waits}`;
  }
  if (application.installed) return `installed${application.running ? ", running" : ""}${waits}`;
  return `${application.placeholderKind ?? "placeholder"}${waits}`;
}

export const waitSentence = (waitingFor) => `waits ${waitingFor.sentence}`;
