// Numbers, times and names as people say them. Names come from whoever reports: what
// could act on a line instead of standing in it is shown as its number.

const UNSAFE = /[\u0000-\u001f\u007f-\u009f\u00ad\u061c\u115f\u1160\u17b4\u17b5\u180e\u200b-\u200f\u2028-\u202e\u2060-\u206f\ufe00-\ufe0f\ufeff\ufff0-\uffff]|[\ud800-\udbff](?![\udc00-\udfff])|(?<![\ud800-\udbff])[\udc00-\udfff]|\udb40[\udc00-\udfff]/gu;

function plain(text) {
  return String(text).replace(UNSAFE, (c) => `\\u{${c.codePointAt(0).toString(16)}}`);
}

function shortened(text, most) {
  const all = plain(text);
  return all.length <= most ? all : `${all.slice(0, most - 1).replace(/[\ud800-\udbff]$/, "")}…`;
}

function nameOr(name, otherwise) {
  return name === null || name === undefined || name === "" ? otherwise : plain(name);
}

function applicationName(of) {
  return of.others ? "all others" : nameOr(of.name, "(no name)");
}

const whole = d3.format(",");

function counted(count, one, many) {
  return `${whole(count)} ${count === 1 ? one : many}`;
}

// Three digits at most: "0.9", "12.5", "320".
function digits(value) {
  const size = Math.abs(value);
  return value.toFixed(size < 10 && value !== Math.round(value) ? 1 : 0);
}

// "320 ms", "4.2 s", "12 min 5 s", "3 h 20 min", in one piece.
function lengthOf(seconds) {
  return lengthInWords(seconds).replaceAll(" ", "\u00a0");
}
function lengthInWords(seconds) {
  if (seconds === null || seconds === undefined || !isFinite(seconds)) return "";
  if (seconds < 0.001 && seconds > 0) return `${digits(seconds * 1e6)} µs`;
  if (seconds < 0.9995) return seconds === 0 ? "0 s" : `${digits(seconds * 1e3)} ms`;
  if (seconds < 59.95) return `${digits(seconds)} s`;
  const all = Math.round(seconds);
  if (all < 3600) return `${Math.floor(all / 60)} min${all % 60 ? ` ${all % 60} s` : ""}`;
  const minutes = Math.round(seconds / 60);
  return `${whole(Math.floor(minutes / 60))} h${minutes % 60 ? ` ${minutes % 60} min` : ""}`;
}

// Of nanoseconds, with the unit that suits: "1.25 ms".
function fineLength(ns) {
  if (ns === null || ns === undefined) return "";
  const [scale, unit] = ns < 1e3 ? [1, "ns"] : ns < 1e6 ? [1e3, "µs"] : ns < 1e9 ? [1e6, "ms"]
    : [1e9, "s"];
  const value = ns / scale;
  return `${value.toFixed(unit === "ns" ? 0 : value < 10 ? 2 : value < 100 ? 1 : 0)}\u00a0${unit}`;
}

// A number of whatever unit a driver counts in.
const NANOSECONDS = { ns: 1, us: 1e3, "µs": 1e3, ms: 1e6, s: 1e9 };
function inUnit(value, unit) {
  const scale = NANOSECONDS[unit];
  return scale ? fineLength(value * scale).replace(/(\.\d*?)0+(?=\u00a0)/, "$1").replace(/\.(?=\u00a0)/, "") : `${whole(value)} ${plain(unit)}`.trim();
}

const day = d3.timeFormat("%-d %B %Y");
const clock = d3.timeFormat("%H:%M:%S");

function dateOf(seconds) {
  return new Date(seconds * 1000);
}
function timeOf(seconds) {
  return seconds === null ? "" : clock(dateOf(seconds));
}
function fineTimeOf(seconds) {
  return seconds === null ? "" : d3.timeFormat("%H:%M:%S.%L")(dateOf(seconds)).slice(0, -2);
}
function dayAndTime(seconds) {
  return seconds === null || seconds === undefined ? ""
    : d3.timeFormat("%Y-%m-%d %H:%M:%S")(dateOf(seconds));
}
function span(from, to) {
  const [first, last] = [day(dateOf(from)), day(dateOf(to))];
  return first === last ? `${first}, ${timeOf(from)} to ${timeOf(to)}`
    : `${first}, ${timeOf(from)}, to ${last}, ${timeOf(to)}`;
}

const CAUSES = {
  process_stopped: "the process was stopped",
  process_frozen: "the process was frozen",
  process_gone: "the process was gone",
  machine_paused: "the machine was paused",
  driver_late: "the device’s driver was late",
  graph_overloaded: "all programs together took too long",
  processor_wait: "it waited for a processor",
  client_slow: "its own work took too long",
  memory: "it waited for memory",
  client_blocked: "it was blocked",
  unknown: "nobody knows why",
};
function causeInWords(cause) {
  return Object.hasOwn(CAUSES, cause) ? CAUSES[cause] : nameOr(cause, "nobody said why");
}

// "firefox, 320 ms silent on out.speaker: the process was stopped"
function glitchInWords(glitch) {
  const captured = glitch.direction === "capture";
  const place = glitch.device ?? glitch.node;
  const length = glitch.seconds === null ? "" : `${lengthOf(glitch.seconds)} `;
  return `${nameOr(glitch.application, "an application")}, ${length}` +
    `${captured ? "missing" : "silent"}` +
    (place ? `${captured ? " from" : " on"} ${plain(place)}` : "") +
    `: ${causeInWords(glitch.cause)}`;
}
