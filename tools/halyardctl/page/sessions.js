// Each session, with its driver statistics when it is opened.

const SESSIONS_AT_ONCE = 15;

function endInWords(session, live) {
  if (session.closed === null) return live ? "still open" : "end not known";
  return { stopped: "", disconnected: "its program left", interrupted: "the daemon ended" }[session.ended] ??
    nameOr(session.ended, "");
}

function sessionSummary(session, live) {
  const length = session.closed !== null && session.opened !== null ? lengthOf(session.closed - session.opened) : "";
  const said = [session.direction ?? "", session.service ? plain(session.service) : "", length, endInWords(session, live),
    session.played_seconds > 0 ? `${lengthOf(session.played_seconds)} of sound` : "",
    counted(session.messages, "message", "messages")].filter(Boolean).join(" · ");
  return element("summary", {}, element("span", { class: "when" }, dayAndTime(session.opened)),
    element("strong", {}, name(nameOr(session.application, "(no name)"))),
    session.glitches > 0 ? element("span", { class: "glitches" }, counted(session.glitches, "glitch", "glitches")) : null,
    element("span", { class: "note" }, said),
    session.devices.length > 0 ? element("span", { class: "note" }, name(session.devices.map((of) => plain(of)).join(", "))) : null);
}

function statisticsOf(session, digest, place) {
  const mine = (of) => of.session === session.id;
  const [histograms, counters] = [digest.histograms.filter(mine), digest.counters.filter(mine)];
  const residencies = digest.residencies.filter(mine).filter(isTelling);
  const width = Math.min(380, widthOf(place) - 2);
  const add = (title, nodes) => {
    if (nodes.length > 0) place.append(element("h3", {}, title), element("div", { class: "panels" }, ...nodes));
  };
  add("Cycle times", histograms.map((of) => histogramPanel(of, width)));
  add("Driver residencies", residencies.map((of) => residencyPanel(of, width)));
  if (counters.length > 0) place.append(element("h3", {}, "Counters"), counterTable(counters));
  if (histograms.length + residencies.length + counters.length === 0) {
    place.append(element("p", { class: "note" }, "The daemon told of no driver statistics in this session."));
  }
}

function sessionEntry(session, digest) {
  const inside = element("div", { class: "inside" });
  const entry = element("details", { class: "session" }, sessionSummary(session, digest.live), inside);
  entry.addEventListener("toggle", () => {
    if (entry.open && inside.childElementCount === 0) statisticsOf(session, digest, inside);
  });
  return entry;
}

function showSessions(digest) {
  const place = chapter("sessions");
  const newest = [...digest.sessions].reverse();
  const list = element("div", {});
  const more = element("button", { type: "button" }, "Show more sessions");
  const add = () => {
    const from = list.childElementCount;
    list.append(...newest.slice(from, from + SESSIONS_AT_ONCE).map((session) => sessionEntry(session, digest)));
    more.hidden = list.childElementCount >= newest.length;
  };
  more.addEventListener("click", add);
  place.append(list, more);
  add();
  // The first that has something to show shows it, one with glitches rather.
  const told = new Set(digest.histograms.map((of) => of.session));
  const telling = newest.slice(0, SESSIONS_AT_ONCE).filter((session) => told.has(session.id));
  const first = telling.find((session) => session.glitches > 0) ?? telling[0];
  if (first) list.children[newest.indexOf(first)].open = true;
}
