// What was measured over a glitch, shown beside the time line when its mark is opened.

const STATES = { R: "running", S: "asleep", D: "waiting for a disk or the like", T: "stopped",
  t: "stopped by a debugger", Z: "ended", I: "idle" };

const EVIDENCE = {
  process_state: ["State of the process", (v) => Object.hasOwn(STATES, v) ? STATES[v] : plain(v)],
  run_delay_seconds: ["Ready, without a processor", lengthOf],
  cpu_seconds: ["Own work on processors", lengthOf],
  major_faults: ["Pages fetched from a disk", whole],
  io_delay_seconds: ["Waited for a disk", lengthOf],
  pressure_cpu_seconds: ["Somebody waited for a processor", lengthOf],
  pressure_memory_seconds: ["Somebody waited for memory", lengthOf],
  pressure_io_seconds: ["Somebody waited for a disk", lengthOf],
  busy_cycles: ["Own work, of a cycle", (v) => `${Math.round(v * 100)} %`],
  driver_late_seconds: ["The device’s timer was late by", lengthOf],
  busiest: ["Busiest programs", (list) => list.map((one) =>
    `${nameOr(one?.name, "?")}${typeof one?.share === "number" ? ` (${Math.round(one.share * 100)} %)` : ""}`).join(", ")],
};

function evidenceValue(key, value) {
  const [, say] = Object.hasOwn(EVIDENCE, key) ? EVIDENCE[key] : [];
  try {
    if (say && (typeof value === "number" || key === "process_state" || Array.isArray(value))) return say(value);
  } catch { /* What is not as it should be is shown as it is. */ }
  return shortened(typeof value === "string" ? value : JSON.stringify(value), 200);
}

function evidenceRows(glitch) {
  const rows = [
    ["When", `${day(dateOf(glitch.start ?? 0))}, ${fineTimeOf(glitch.start)}`],
    ["Application", nameOr(glitch.application, "(no name)")],
    ["Direction", glitch.direction ?? "not known"],
    ["Device", nameOr(glitch.device, "not known")],
    ["Stream", nameOr(glitch.node, "not known")],
    ["Length", glitch.seconds === null ? "not known" : lengthOf(glitch.seconds) +
      (glitch.cycles === null ? "" : ` (${counted(glitch.cycles, "cycle", "cycles")})`)],
    ["Cause", causeInWords(glitch.cause)],
  ];
  if (glitch.inferred) rows.push(["Known from", "other signs; the audio server did not report it"]);
  for (const [key, value] of Object.entries(glitch.evidence ?? {})) {
    const title = Object.hasOwn(EVIDENCE, key) ? EVIDENCE[key][0] : shortened(key, 60);
    rows.push([title, evidenceValue(key, value)]);
  }
  return rows;
}

function evidenceList(glitch) {
  return element("dl", { class: "evidence" }, ...evidenceRows(glitch).flatMap(([title, value]) =>
    [element("dt", {}, title), element("dd", {}, name(value))]));
}

// At most so many of those that share a mark.
const MOST_SHOWN = 20;

let openedFrom = null;

function closeEvidence() {
  const panel = document.getElementById("evidence");
  panel.hidden = true;
  panel.replaceChildren();
  openedFrom?.();
  openedFrom = null;
}

// `back` takes the focus to where it came from.
function openEvidence(glitches, back) {
  const panel = document.getElementById("evidence");
  const heading = element("h3", { tabindex: "-1" }, glitches.length === 1
    ? `Glitch at ${fineTimeOf(glitches[0].start)}`
    : `${whole(glitches.length)} glitches, ${fineTimeOf(glitches[0].start)} to ${fineTimeOf(glitches.at(-1).start)}`);
  const close = element("button", { type: "button", onclick: closeEvidence }, "Close");
  const shown = glitches.slice(0, MOST_SHOWN);
  panel.replaceChildren(element("div", { class: "heading" }, heading, close),
    ...(glitches.length === 1 ? [evidenceList(glitches[0])]
      : shown.map((glitch) => element("details", {},
        element("summary", {}, `${fineTimeOf(glitch.start)}  `, name(glitchInWords(glitch))), evidenceList(glitch)))));
  if (glitches.length > shown.length) {
    panel.append(element("p", { class: "note" }, `and ${whole(glitches.length - shown.length)} more: zoom in to part them, or search the table.`));
  }
  panel.hidden = false;
  openedFrom = back;
  heading.focus();
}

document.addEventListener("keydown", (event) => {
  if (event.key === "Escape" && !document.getElementById("evidence").hidden) closeEvidence();
});
