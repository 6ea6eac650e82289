// A table of everything, a page of rows at a time, with a search over all of them.

const ROWS_AT_ONCE = 50;

function jsonCell(value) {
  if (value === null || value === undefined) return "";
  const text = JSON.stringify(value);
  if (text.length < 80) return element("code", {}, name(plain(text)));
  const details = element("details", {}, element("summary", {}, element("code", {}, name(shortened(text, 80)))));
  details.addEventListener("toggle", () => {
    if (details.open && details.childElementCount === 1) {
      details.append(element("pre", {}, JSON.stringify(value, null, 1).split("\n").map(plain).join("\n")));
    }
  });
  return details;
}
const textCell = (value) => name(value === null || value === undefined ? "" : shortened(value, 120));

const TABLES = {
  glitches: ["Glitches", ["Time", "Application", "Device", "Length", "Cause", "Evidence"], (row) => [dayAndTime(row.start),
    textCell(row.application), textCell(row.device), lengthOf(row.seconds), causeInWords(row.cause), jsonCell(row.evidence)]],
  sessions: ["Sessions", ["Session", "Opened", "Application", "Service", "Direction", "Sound", "Messages", "Glitches", "Devices"],
    (row) => [whole(row.id), dayAndTime(row.opened), textCell(row.application), textCell(row.service), row.direction ?? "",
      lengthOf(row.played_seconds), whole(row.messages), whole(row.glitches), textCell(row.devices.join(", "))]],
  messages: ["Messages", ["Time", "Session", "Application", "Category", "Type", "Content"], (row) => [dayAndTime(row.time),
    row.session === null ? "" : whole(row.session), textCell(row.application), textCell(row.category), textCell(row.type),
    jsonCell(row.payload)]],
  events: ["Analytics events", ["Time", "Name", "Content"], (row) => [dayAndTime(row.time), textCell(row.name), jsonCell(row.payload)]],
  energy: ["Energy events", ["Time", "Name", "Client", "Content"], (row) => [dayAndTime(row.time), textCell(row.name),
    textCell(row.client), jsonCell(row.payload)]],
  incidents: ["Incidents", ["Time", "Signature", "Report"], (row) => [dayAndTime(row.time), jsonCell(row.signature), textCell(row.report)]],
  metrics: ["Metrics", ["Time", "Metric", "Content"], (row) => [dayAndTime(row.time), textCell(row.metric_id), jsonCell(row.message)]],
};

class Listing {
  constructor(place, sources) {
    this.place = place;
    this.sources = sources;
    this.kind = place.querySelector("select");
    this.search = place.querySelector("input");
    this.status = place.querySelector("[role=status]");
    this.turn = 0; // of the latest request: answers to older ones come too late
    for (const key of Object.keys(sources)) {
      this.kind.append(element("option", { value: key }, `${TABLES[key][0]} (${whole(sources[key].total)})`));
    }
    this.kind.addEventListener("change", () => this.show(0, true));
    let waiting = 0;
    this.search.addEventListener("input", () => {
      clearTimeout(waiting);
      waiting = setTimeout(() => this.show(0, true), 200);
    });
    const buttons = place.querySelectorAll(".pages button");
    [this.newer, this.older] = buttons;
    this.newer.addEventListener("click", () => this.show(this.first - ROWS_AT_ONCE, false));
    this.older.addEventListener("click", () => this.show(this.first + ROWS_AT_ONCE, false));
    this.show(0, true);
  }

  async show(first, anew) {
    const turn = ++this.turn;
    const source = this.sources[this.kind.value];
    const words = this.search.value.toLowerCase().split(/\s+/).filter(Boolean);
    if (anew) this.found = words.length > 0 ? await source.find(words) : null;
    const count = this.found ? this.found.length : source.kept;
    const last = Math.min(first + ROWS_AT_ONCE, count);
    const rows = [];
    for (let i = first; i < last; ++i) rows.push(await source.row(this.found ? this.found[i] : i));
    if (turn !== this.turn) return;
    this.first = first;
    this.fill(rows);
    this.status.textContent = this.statusInWords(source, count, first, last);
    this.newer.disabled = first === 0;
    this.older.disabled = last >= count;
  }

  statusInWords(source, count, first, last) {
    const rows = count === 0 ? (this.found ? "Nothing found" : "Nothing") : `${whole(first + 1)} to ${whole(last)} of ${whole(count)}, newest first`;
    return source.kept < source.total ? `${rows}. The newest ${whole(source.kept)} of ${whole(source.total)} are in this page.` : `${rows}.`;
  }

  fill(rows) {
    const [title, columns, cells] = TABLES[this.kind.value];
    const table = element("table", { class: "plain" }, element("caption", { class: "unseen" }, title),
      headerRow(columns.map((column) => [column])),
      element("tbody", {}, ...rows.map((row) => element("tr", {}, ...cells(row).map((cell) => element("td", {}, cell))))));
    this.place.querySelector(".wide").replaceChildren(table);
  }
}

function showTable(digest) {
  const sources = {};
  if (digest.glitches.length > 0) sources.glitches = new PlainRows(digest.glitches, digest.left_out.glitches);
  if (digest.sessions.length > 0) sources.sessions = new PlainRows(digest.sessions, digest.left_out.sessions);
  for (const [key, table] of Object.entries(digest.tables)) {
    if (table.total > 0 && Object.hasOwn(TABLES, key)) sources[key] = new PackedRows(table);
  }
  if (Object.keys(sources).length === 0) return;
  const section = document.getElementById("table");
  section.hidden = false;
  new Listing(section, sources);
}
