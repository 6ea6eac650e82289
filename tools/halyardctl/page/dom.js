// Elements, made without markup: whatever a text holds, it stays a text.

function element(name, attributes = {}, ...children) {
  const made = document.createElement(name);
  for (const [key, value] of Object.entries(attributes)) {
    if (key.startsWith("on")) made.addEventListener(key.slice(2), value);
    else if (value === true) made.setAttribute(key, "");
    else if (value !== false && value !== null && value !== undefined) made.setAttribute(key, value);
  }
  made.append(...children.filter((child) => child !== null && child !== undefined));
  return made;
}

function name(text) {
  return element("bdi", {}, text);
}

// A drawing of the chart library; `label` says to who cannot see it what is in it.
function drawing(width, height, label) {
  return d3.create("svg").attr("viewBox", `0 0 ${width} ${height}`).attr("width", width)
    .attr("height", height).attr("role", "img").attr("aria-label", label);
}

function headerRow(titles) {
  return element("thead", {}, element("tr", {},
    ...titles.map(([title, kind]) => element("th", { scope: "col", class: kind }, title))));
}

function chapter(id) {
  const section = document.getElementById(id);
  section.hidden = false;
  return section.querySelector(".body") ?? section;
}

// How wide a text is in a drawing.
const measure = document.createElement("canvas").getContext("2d");
function textWidth(text, font) {
  measure.font = `${font} ${getComputedStyle(document.documentElement).fontFamily}`;
  return measure.measureText(text).width;
}

// A text cut to what fits into a drawing.
function fittedText(text, width, font) {
  let fitted = plain(text);
  for (let most = Math.min(fitted.length, 200); most > 1 && textWidth(fitted, font) > width; --most) {
    fitted = shortened(text, most);
  }
  return fitted;
}

function widthOf(place) {
  return Math.max(280, Math.floor(place.clientWidth || 960));
}
