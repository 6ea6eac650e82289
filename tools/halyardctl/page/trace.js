// The durations of a trace, when a results file was given.

function durationDrawing(of, x, width) {
  const svg = drawing(width, 18, `From ${fineLength(of.min)} to ${fineLength(of.max)}, median ${fineLength(of.median)}`);
  svg.append("line").attr("class", "range").attr("x1", x(of.min)).attr("x2", x(of.max)).attr("y1", 9).attr("y2", 9);
  svg.append("rect").attr("class", "bar").attr("x", x(of.median)).attr("y", 5).attr("height", 8)
    .attr("width", Math.max(1, x(of.p90) - x(of.median)));
  svg.append("line").attr("class", "middle").attr("x1", x(of.median)).attr("x2", x(of.median)).attr("y1", 2).attr("y2", 16);
  svg.append("line").attr("class", "late").attr("x1", x(of.p99)).attr("x2", x(of.p99)).attr("y1", 4).attr("y2", 14);
  return svg.node();
}

function showTrace(durations) {
  const place = chapter("trace");
  const measured = durations.filter((of) => of.count > 0);
  if (measured.length === 0) {
    place.append(element("p", {}, "Nothing was measured."));
    return;
  }
  const x = d3.scaleLog().domain([Math.max(1, d3.min(measured, (of) => of.min)), Math.max(2, d3.max(measured, (of) => of.max))])
    .range([3, 237]).clamp(true);
  const number = (value) => element("td", { class: "number" }, fineLength(value));
  const table = element("table", { class: "plain" },
    headerRow([["Name"], ["Count", "number"], ["Median", "number"], ["p90", "number"], ["p99", "number"], ["Max", "number"],
      ["Total", "number"], ["Least to most, logarithmic"]]),
    element("tbody", {}, ...measured.map((of) => element("tr", {}, element("td", {}, name(shortened(of.name, 60))),
      element("td", { class: "number" }, whole(of.count)), number(of.median), number(of.p90), number(of.p99),
      number(of.max), number(of.total), element("td", {}, durationDrawing(of, x, 240))))));
  place.append(element("div", { class: "wide", tabindex: "0", role: "region", "aria-label": "Durations of the trace" }, table));
}
