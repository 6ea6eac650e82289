// Glitches by application, device and cause: a bar for each.

const MOST_BARS = 8;
const BAR_FONT = "13px";

function valueOf(bar) {
  return `${whole(bar.glitches)} · ${lengthOf(bar.seconds)}`;
}

function barsOf(sums, say) {
  const most = sums.length === MOST_BARS + 1 ? sums.length : MOST_BARS;
  const shown = sums.slice(0, most).map((sum) => ({ ...sum, title: sum.others ? "all others" : say(sum.name) }));
  const rest = sums.slice(most);
  if (rest.length > 0) {
    shown.push({ title: counted(rest.length, "other", "others"), glitches: d3.sum(rest, (sum) => sum.glitches),
      seconds: d3.sum(rest, (sum) => sum.seconds) });
  }
  return shown;
}

function barDrawing(title, bars, width) {
  const line = 44;
  const label = `${title}: ${bars.map((bar) => `${bar.title} ${whole(bar.glitches)}, ${lengthOf(bar.seconds)}`).join("; ")}`;
  const svg = drawing(width, bars.length * line, label);
  const x = d3.scaleLinear().domain([0, d3.max(bars, (bar) => bar.glitches)]).range([0, width]);
  const y = d3.scaleBand().domain(d3.range(bars.length)).range([0, bars.length * line]);
  const rows = svg.selectAll("g").data(bars).join("g").attr("transform", (_, index) => `translate(0,${y(index)})`);
  rows.append("text").attr("class", "name").attr("y", 15)
    .text((bar) => fittedText(bar.title, width - textWidth(valueOf(bar), BAR_FONT) - 12, BAR_FONT));
  rows.append("text").attr("class", "value").attr("x", width).attr("y", 15).attr("text-anchor", "end")
    .text(valueOf);
  rows.append("rect").attr("class", "track").attr("y", 22).attr("width", width).attr("height", 8).attr("rx", 2);
  rows.append("rect").attr("class", "bar").attr("y", 22).attr("height", 8).attr("rx", 2)
    .attr("width", (bar) => Math.max(2, x(bar.glitches)));
  rows.append("title").text((bar) => bar.title);
  return svg.node();
}

function showSums(digest) {
  const place = chapter("sums");
  const kinds = [["By application", digest.by_application, (of) => nameOr(of, "(no name)")],
    ["By device", digest.by_device, (of) => nameOr(of, "(no device named)")],
    ["By cause", digest.by_cause, causeInWords]];
  for (const [title, sums, say] of kinds) {
    const panel = element("div", { class: "panel" }, element("h3", {}, title));
    place.append(panel);
    panel.append(barDrawing(title, barsOf(sums, say), Math.min(420, widthOf(panel))));
  }
}
