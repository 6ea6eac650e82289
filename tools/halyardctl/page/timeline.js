// The time line. It is drawn anew for each change of what it shows; marks that lie under
// each other are one, so that it stays a few hundred elements whatever the store holds.

const LANE = { played: 30, captured: 12, row: 66 };
const FEW_ROWS = 12;
const LABEL_FONT = "600 13.5px";

class Timeline {
  constructor(place, digest) {
    this.place = place;
    this.rows = rowsOf(digest);
    this.all = timesOf(digest, this.rows);
    this.shown = [...this.all];
    this.most = FEW_ROWS;
    this.current = 0; // the mark that Tab comes to
    this.drawingPlace = place.querySelector(".drawing");
    this.tip = place.querySelector(".tip");
    this.addControls();
    this.draw();
    new ResizeObserver(() => {
      if (widthOf(this.drawingPlace) !== this.width) this.draw();
    }).observe(this.drawingPlace);
  }

  addControls() {
    const controls = this.place.querySelector(".controls");
    const add = (text, label, change) => controls.append(
      element("button", { type: "button", "aria-label": label, onclick: () => change() }, text));
    add("+", "Zoom in", () => this.scale(0.5));
    add("−", "Zoom out", () => this.scale(2));
    add("←", "Earlier", () => this.move(-0.5));
    add("→", "Later", () => this.move(0.5));
    add("Whole", "Show the whole time", () => this.show(...this.all));
    if (this.rows.length > FEW_ROWS) {
      add(`All ${this.rows.length} applications`, "Show the rows of all applications", () => {
        this.most = Infinity;
        controls.lastChild.remove();
        this.draw();
      });
    }
  }

  show(from, to) {
    const length = Math.min(Math.max(to - from, 0.01), this.all[1] - this.all[0]);
    const start = Math.min(Math.max(from, this.all[0]), this.all[1] - length);
    this.shown = [start, start + length];
    this.draw();
  }
  scale(by, at = 0.5) {
    const [from, to] = this.shown;
    const point = from + (to - from) * at;
    this.show(point - (point - from) * by, point + (to - point) * by);
  }
  move(by) {
    const [from, to] = this.shown;
    this.show(from + (to - from) * by, to + (to - from) * by);
  }

  draw() {
    this.width = widthOf(this.drawingPlace);
    this.narrow = this.width < 620;
    this.left = this.narrow ? 6 : 170;
    const plot = this.width - this.left - 30;
    this.x = d3.scaleTime().domain(this.shown.map(dateOf)).range([0, plot]);
    this.at = (seconds) => this.x(seconds * 1000);
    const rows = this.rows.slice(0, this.most);
    this.rowHeight = LANE.row + (this.narrow ? 20 : 0);
    const height = rows.length * this.rowHeight + 30;
    const svg = d3.create("svg").attr("viewBox", `0 0 ${this.width} ${height}`)
      .attr("width", this.width).attr("height", height).attr("role", "group")
      .attr("aria-label", "Time line, a row for each application")
      .attr("aria-describedby", "timeline-hint");
    svg.append("clipPath").attr("id", "plot").append("rect").attr("y", -20).attr("x", -8)
      .attr("width", plot + 16).attr("height", height);
    const body = svg.append("g").attr("transform", `translate(${this.left},0)`);
    this.drawAxis(body, rows.length * this.rowHeight, plot);
    this.marks = [];
    rows.forEach((row, index) => this.drawRow(body, row, index, plot));
    this.drawMarks(body);
    this.follow(svg, rows, plot);
    this.drawingPlace.replaceChildren(svg.node());
  }

  drawAxis(body, bottom, plot) {
    const axis = d3.axisBottom(this.x).ticks(Math.max(2, plot / (this.narrow ? 120 : 100))).tickSizeInner(-bottom)
      .tickSizeOuter(0).tickPadding(8).tickFormat(this.tickFormat());
    body.append("g").attr("class", "axis").attr("aria-hidden", "true")
      .attr("transform", `translate(0,${bottom})`).call(axis);
  }
  tickFormat() {
    const length = this.shown[1] - this.shown[0];
    const small = d3.timeFormat(length < 3 ? "%H:%M:%S.%L" : length < 600 ? "%H:%M:%S" : "%H:%M");
    const midnight = d3.timeFormat("%-d %b");
    return (date) => d3.timeDay(date) < date ? small(date) : midnight(date);
  }

  drawRow(body, row, index, plot) {
    const top = index * this.rowHeight + (this.narrow ? 20 : 0);
    const base = top + 18 + LANE.played;
    this.drawLabel(body, row, index * this.rowHeight, plot);
    const lane = body.append("g").attr("clip-path", "url(#plot)").attr("aria-hidden", "true");
    lane.append("path").attr("class", "open")
      .attr("d", barsPath(row.open.map(({ from, to }) => ({ from, to, volume: 1 })), this.at, plot, base + 1, 2));
    lane.append("path").attr("class", "played").attr("d", barsPath(row.played, this.at, plot, base, LANE.played));
    lane.append("path").attr("class", "captured")
      .attr("d", barsPath(row.captured, this.at, plot, base + 3 + LANE.captured, LANE.captured));
    lane.selectAll("path.route").data(row.routes.filter((route) => Math.abs(this.at(route.time) - plot / 2) < plot / 2))
      .join("path").attr("class", "route").attr("d", "M0,0l4.5,8h-9z")
      .attr("transform", (route) => `translate(${this.at(route.time)},${base + 2})`);
    const marks = marksOf(row, this.at, plot);
    for (const mark of marks) Object.assign(mark, { top: top + 9, base });
    lane.selectAll("path.missing").data(marks).join("path").attr("class", "missing")
      .attr("d", (mark) => barsPath(mark.glitches.map((glitch) =>
        ({ from: glitch.start, to: glitch.start + (glitch.seconds ?? 0), volume: 1 })), this.at, plot, base, LANE.played));
    this.marks.push(...marks);
    if (index > 0) body.append("line").attr("class", "between").attr("x1", -this.left + 2)
      .attr("x2", plot).attr("y1", index * this.rowHeight).attr("y2", index * this.rowHeight);
  }

  drawLabel(body, row, top, plot) {
    const said = [row.seconds > 0 ? lengthOf(row.seconds) : "",
      row.glitches.length > 0 ? counted(row.glitches.length, "glitch", "glitches") : ""].filter(Boolean).join(" · ");
    const label = body.append("text").attr("class", "label");
    if (this.narrow) {
      label.attr("x", 0).attr("y", top + 16).text(fittedText(row.title, plot / 2, LABEL_FONT));
      label.append("tspan").attr("class", "small").attr("dx", 8).text(said);
    } else {
      label.attr("x", -this.left + 4).attr("y", top + 30).text(fittedText(row.title, this.left - 12, LABEL_FONT));
      label.append("tspan").attr("class", "small").attr("x", -this.left + 4).attr("dy", 17).text(said);
    }
    label.append("title").text(row.title);
  }

  drawMarks(body) {
    this.current = Math.max(0, Math.min(this.current, this.marks.length - 1));
    const marks = body.append("g").selectAll("g").data(this.marks).join("g").attr("class", "mark")
      .attr("transform", (mark) => `translate(${mark.at},${mark.top})`)
      .attr("role", "button").attr("tabindex", (_, index) => index === this.current ? 0 : -1)
      .attr("aria-label", (mark) => this.markInWords(mark));
    marks.append("circle").attr("class", "reach").attr("r", 12);
    const single = marks.filter((mark) => mark.glitches.length === 1);
    single.append("path").attr("class", "sign").attr("d", d3.symbol().type(d3.symbolDiamond).size(95));
    const several = marks.filter((mark) => mark.glitches.length > 1);
    several.append("circle").attr("class", "sign").attr("r", 8.5);
    several.append("text").attr("dy", "0.35em").text((mark) => mark.glitches.length > 99 ? "…" : mark.glitches.length);
    marks.append("title").text((mark) => this.markInWords(mark));
    this.markNodes = marks.nodes();
    // This version of the library gives listeners the datum and the index.
    marks.on("click", (mark, index) => this.open(mark, index));
    marks.on("keydown", (mark, index) => this.press(d3.event, mark, index));
  }
  markInWords({ glitches }) {
    return glitches.length === 1 ? `${fineTimeOf(glitches[0].start)}  ${glitchInWords(glitches[0])}`
      : `${counted(glitches.length, "glitch", "glitches")} of ${nameOr(glitches[0].application, "an application")}, ` +
        `${fineTimeOf(glitches[0].start)} to ${fineTimeOf(glitches.at(-1).start)}`;
  }
  open(mark, index) {
    this.focusMark(index);
    openEvidence(mark.glitches, () => this.markNodes[this.current]?.focus());
  }
  press(event, mark, index) {
    const step = { ArrowRight: 1, ArrowLeft: -1, ArrowDown: 1, ArrowUp: -1 }[event.key];
    if (step) this.focusMark(index + step);
    else if (event.key === "Home") this.focusMark(0);
    else if (event.key === "End") this.focusMark(this.marks.length - 1);
    else if (event.key === "Enter" || event.key === " ") this.open(mark, index);
    else return;
    event.preventDefault();
  }
  focusMark(index) {
    if (index < 0 || index >= this.markNodes.length) return;
    this.markNodes[this.current]?.setAttribute("tabindex", -1);
    this.current = index;
    this.markNodes[index].setAttribute("tabindex", 0);
    this.markNodes[index].focus();
  }

  // The pointer: says what lies under it, drags, and zooms with the control key.
  follow(svg, rows, plot) {
    const node = svg.node();
    node.addEventListener("pointermove", (event) => this.tell(event, rows, plot));
    node.addEventListener("pointerleave", () => { this.tip.hidden = true; });
    node.addEventListener("wheel", (event) => {
      if (!event.ctrlKey) return;
      event.preventDefault();
      this.scale(event.deltaY > 0 ? 1.25 : 0.8, (event.offsetX - this.left) / plot);
    }, { passive: false });
  }
  tell(event, rows, plot) {
    const box = this.drawingPlace.getBoundingClientRect();
    const [left, top] = [event.clientX - box.left, event.clientY - box.top];
    const row = rows[Math.floor(top / this.rowHeight)];
    const time = this.x.invert(left - this.left).getTime() / 1000;
    const near = 4 * (this.shown[1] - this.shown[0]) / plot;
    const route = row?.routes.find((one) => Math.abs(one.time - time) < near);
    const stretch = row && [...row.played, ...row.captured].find(({ from, to }) => from - near / 4 <= time && time <= to + near / 4);
    this.tip.hidden = !(route || stretch) || left < this.left;
    if (this.tip.hidden) return;
    this.tip.textContent = route
      ? `${timeOf(route.time)}  moved to ${route.devices.map(plain).join(", ") || "no device"}`
      : `${timeOf(stretch.from)} to ${timeOf(stretch.to)}, ${lengthOf(stretch.to - stretch.from)}` +
        `${stretch.volume === null ? "" : `, volume ${Math.round(stretch.volume * 100)} %`}` +
        ` · ${stretch.about.devices.map(plain).join(", ")}`;
    this.tip.style.left = `${Math.min(Math.max(left - 90, 0), box.width - 240)}px`;
    this.tip.style.top = `${top + 18}px`;
  }
}

function showTimeline(digest) {
  const section = document.getElementById("timeline");
  section.hidden = false;
  const rows = rowsOf(digest);
  if (rows.length === 0) {
    section.hidden = true;
    return;
  }
  new Timeline(section, digest);
}
