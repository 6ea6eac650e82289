// Driver statistics of a session: histograms, and how long devices were in which state.

// Whole powers of ten, so that histograms of few buckets look like those of many.
function spanOfBuckets(buckets) {
  const bounds = buckets.flatMap(([lower, upper]) => [lower, upper]).filter((bound) => bound > 0);
  const [least, most] = [d3.min(bounds) ?? 1, d3.max(bounds) ?? 10];
  const first = Math.floor(Math.log10(least) + 1e-9);
  return [10 ** first, 10 ** Math.max(first + 1, Math.ceil(Math.log10(most) - 1e-9))];
}

// The daemon's keys have no blanks.
const CHANNELS = { Cycletime: "Cycle time", Missedcycles: "Missed cycles", cpusome: "Somebody waited for a processor",
  cpufull: "All waited for a processor", iosome: "Somebody waited for a disk", iofull: "All waited for a disk",
  memorysome: "Somebody waited for memory", memoryfull: "All waited for memory" };
function channelName(of) {
  return Object.hasOwn(CHANNELS, of.channel) ? CHANNELS[of.channel] : plain(of.channel);
}
// Of counters the daemon tells no unit; time lost to pressure is in microseconds.
function counterValue(counter) {
  return counter.driver === "Pressure" ? lengthOf(counter.value / 1e6) : whole(counter.value);
}

// The bucket in which the share lies, as "30 µs to 50 µs".
function bucketAt(histogram, share) {
  const all = d3.sum(histogram.buckets, ([, , hits]) => hits);
  let sum = 0;
  for (const [lower, upper, hits] of histogram.buckets) {
    sum += hits;
    if (sum >= share * all) return `${inUnit(lower, histogram.unit)} to ${inUnit(upper, histogram.unit)}`;
  }
  return "";
}

function histogramDrawing(histogram, width) {
  const { buckets, unit } = histogram;
  const [height, top, bottom] = [132, 8, 26];
  const all = d3.sum(buckets, ([, , hits]) => hits);
  const label = `${channelName(histogram)} of ${plain(histogram.driver)}: ${whole(all)} in all, ` +
    `half of them below ${bucketAt(histogram, 0.5).split(" to ")[1]}, the longest up to ${inUnit(histogram.max, unit)}`;
  const svg = drawing(width, height, label);
  const [first, last] = spanOfBuckets(buckets);
  const x = d3.scaleLog().domain([first, last]).range([18, width - 22]).clamp(true);
  // Square roots keep the rare ones, which are what matters, in sight.
  const y = d3.scaleSqrt().domain([0, d3.max(buckets, ([, , hits]) => hits)]).range([height - bottom, top]);
  svg.append("g").selectAll("rect").data(buckets).join("rect").attr("class", "bar")
    .attr("x", ([lower]) => x(Math.max(lower, first)) + 0.5)
    .attr("width", ([lower, upper]) => Math.max(1.5, x(upper) - x(Math.max(lower, first)) - 1))
    .attr("y", ([, , hits]) => Math.min(y(hits), height - bottom - 1.5))
    .attr("height", ([, , hits]) => Math.max(1.5, height - bottom - y(hits)))
    .append("title").text(([lower, upper, hits]) =>
      `${inUnit(lower, unit)} to ${inUnit(upper, unit)}: ${whole(hits)} (${d3.format(".2~%")(hits / all)})`);
  const values = d3.range(Math.round(Math.log10(first)), Math.round(Math.log10(last)) + 1).map((power) => 10 ** power);
  svg.append("g").attr("class", "axis").attr("transform", `translate(0,${height - bottom})`)
    .call(d3.axisBottom(x).tickValues(values).tickSizeOuter(0).tickFormat((value) => inUnit(value, unit)));
  return svg.node();
}

function histogramPanel(histogram, width) {
  const all = d3.sum(histogram.buckets, ([, , hits]) => hits);
  return element("figure", { class: "panel" },
    element("figcaption", {}, element("strong", {}, channelName(histogram)),
      " · ", name(plain(histogram.driver)),
      element("span", { class: "note" }, `${whole(all)} · half below ${bucketAt(histogram, 0.5).split(" to ")[1]} · at most ${inUnit(histogram.max, histogram.unit)}`)),
    histogramDrawing(histogram, width));
}

const MOST_STATES = 6;

function residencyDrawing(residency, states, width) {
  const label = `${plain(residency.driver)} ${plain(residency.channel)}: ${states.map((state) =>
    `${plain(state.name)} ${d3.format(".1%")(state.duty_cycle)}`).join(", ")}`;
  const svg = drawing(width, 12, label);
  const x = d3.scaleLinear().domain([0, Math.max(1, d3.sum(states, (state) => state.duty_cycle))]).range([0, width]);
  svg.append("rect").attr("class", "track").attr("width", width).attr("height", 12).attr("rx", 2);
  let from = 0;
  states.forEach((state, index) => {
    svg.append("rect").attr("class", `state state-${index % MOST_STATES}`).attr("height", 12).attr("x", x(from))
      .attr("width", Math.max(0, x(state.duty_cycle) - (state.duty_cycle > 0.01 ? 1 : 0)))
      .append("title").text(`${plain(state.name)}: ${d3.format(".2%")(state.duty_cycle)}`);
    from += state.duty_cycle;
  });
  return svg.node();
}

// The states of one channel, as a bar and in words.
function residencyPanel(residency, width) {
  const states = [...residency.states].sort((one, other) => other.duty_cycle - one.duty_cycle);
  const shown = states.slice(0, MOST_STATES);
  return element("figure", { class: "panel" },
    element("figcaption", {}, element("strong", {}, name(plain(residency.channel))), " · ", name(plain(residency.driver))),
    residencyDrawing(residency, shown, width),
    element("ul", { class: "states" }, ...shown.map((state, index) => element("li", {},
      element("i", { class: `state-${index}` }), name(shortened(state.name, 40)), ` ${d3.format(".1%")(state.duty_cycle)}`,
      state.transitions > 0 ? element("span", { class: "note" }, ` ${counted(state.transitions, "time", "times")}`) : "")),
    states.length > shown.length ? element("li", {}, `and ${states.length - shown.length} more`) : ""));
}

function counterTable(counters) {
  return element("table", { class: "plain counters" }, headerRow([["Counter"], ["Of"], ["Change", "number"]]),
    element("tbody", {}, ...counters.map((counter) => element("tr", {},
      element("td", {}, name(channelName(counter))), element("td", {}, name(nameOr(counter.driver, plain(counter.group)))),
      element("td", { class: "number" }, counterValue(counter))))));
}

// Idle and power states that were never left say nothing.
function isTelling(residency) {
  return residency.states.some((state) => state.duty_cycle >= 0.0005);
}
