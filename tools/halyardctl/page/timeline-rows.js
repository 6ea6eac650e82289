// What the time line has in its rows: one for each application, with the stretches in
// which it played and captured, its routes and its glitches.

function emptyRow(of) {
  return { title: applicationName(of), played: [], captured: [], open: [], routes: [], glitches: [],
    seconds: of.played_seconds + of.captured_seconds };
}

// Rows by the names of applications, those with most sound first.
function rowsOf(digest) {
  const rows = new Map();
  const rowOf = (application) => {
    const key = application ?? null;
    if (!rows.has(key)) {
      rows.set(key, emptyRow({ name: key, others: false, played_seconds: 0, captured_seconds: 0 }));
    }
    return rows.get(key);
  };
  for (const of of digest.applications) if (!of.others) rows.set(of.name, emptyRow(of));
  const sessions = new Map(digest.sessions.map((session) => [session.id, session]));
  for (const session of digest.sessions) {
    const from = session.opened ?? session.last_heard;
    const to = session.closed ?? (digest.live ? digest.made : session.last_heard) ?? from;
    if (from !== null) rowOf(session.application).open.push({ from, to, session });
  }
  for (const stretch of digest.stretches) {
    const session = sessions.get(stretch.session);
    if (!session) continue;
    const row = rowOf(session.application);
    (session.direction === "capture" ? row.captured : row.played).push({ ...stretch, about: session });
  }
  for (const route of digest.routes) {
    const session = sessions.get(route.session);
    if (session) rowOf(session.application).routes.push(route);
  }
  for (const glitch of digest.glitches) {
    if (glitch.start !== null) rowOf(glitch.application).glitches.push(glitch);
  }
  for (const row of rows.values()) row.glitches.sort((one, other) => one.start - other.start);
  return [...rows.values()].filter((row) => row.open.length + row.glitches.length > 0);
}

function timesOf(digest, rows) {
  const times = rows.flatMap((row) => [...row.open, ...row.played, ...row.captured]
    .flatMap(({ from, to }) => [from, to])
    .concat(row.glitches.flatMap((glitch) => [glitch.start, glitch.start + (glitch.seconds ?? 0)])));
  const first = Math.max(d3.min(times), digest.since ?? -Infinity);
  const last = Math.min(d3.max(times), digest.until ?? Infinity);
  const margin = Math.max((last - first) * 0.01, 0.2);
  return [first - margin, last + margin];
}

// The glitches of a row as marks: those that would cover each other share one.
const MARK_DISTANCE = 14;
function marksOf(row, x, width) {
  const marks = [];
  for (const glitch of row.glitches) {
    const at = x(glitch.start);
    if (at < -1 || at > width + 1) continue;
    const last = marks.at(-1);
    if (last && at - last.first < MARK_DISTANCE) last.glitches.push(glitch);
    else marks.push({ row, first: at, glitches: [glitch] });
  }
  for (const mark of marks) mark.at = (mark.first + x(mark.glitches.at(-1).start)) / 2;
  return marks;
}

// One path for all stretches of a lane: bars from `base`, as high as their volume.
function barsPath(stretches, x, width, base, height) {
  let path = "";
  for (const { from, to, volume } of stretches) {
    const left = Math.max(x(from), -1);
    const right = Math.min(Math.max(x(to), left + 1), width + 1);
    if (right < 0 || left > width || right <= left) continue;
    const high = Math.max(2, Math.min(1, volume ?? 1) * height);
    path += `M${left.toFixed(1)},${base}v${-high.toFixed(1)}h${(right - left).toFixed(1)}v${high.toFixed(1)}z`;
  }
  return path;
}
