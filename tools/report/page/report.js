// Draws the page from the JSON in it. docs/report.md lists its keys. Names come from the trace and
// cannot be trusted: they become text, never markup.
"use strict";

const data = JSON.parse(document.getElementById("data").textContent);
const advice = JSON.parse(document.getElementById("advice").textContent);  // Of mempool advise, or null.

// Numbers as in the text report: 1,234,567; three digits and a unit; a share in percent.

const count = (number) => number.toLocaleString("en-US");

function bytes(value) {
  const units = ["B", "KB", "MB", "GB", "TB", "PB", "EB"];
  let unit = 0;
  while (value >= 999.5 && unit + 1 < units.length) {
    value /= 1000;
    ++unit;
  }
  return value.toFixed(unit === 0 || value >= 99.95 ? 0 : value >= 9.995 ? 1 : 2) + " " + units[unit];
}

const percent = (part, whole) => (whole === 0 ? "-" : (100 * part / whole).toFixed(1) + " %");

// The same for an axis, without trailing zeros.
const bytesTick = (value) => bytes(value).replace(/\.0+ |(\.\d*?)0+ /, "$1 ");
const countTick = (value) =>
  value >= 1e9 ? value / 1e9 + " G" : value >= 1e6 ? value / 1e6 + " M" : count(value);

const byId = (id) => d3.select("#" + id);
const shortLived = (row) => row.lifetimes[0] + row.lifetimes[1];
const sum = (numbers) => numbers.reduce((a, b) => a + b, 0);
const sizeText = (row) =>
  row.smallest === row.largest ? count(row.smallest) : count(row.smallest) + "–" + count(row.largest);

const tracedPools = sum(data.groups.map((group) => group.pools));
const colours = ["#4e79a7", "#f28e2b", "#59a14f", "#b07aa1", "#e15759", "#76b7b2", "#edc948", "#9c755f", "#ff9da7", "#9aa0a6"];

// A name; if it is too long, with "<…>" for template arguments and then without its middle.
function shortName(name, most) {
  for (let longer = ""; name.length > most && name !== longer;) {
    longer = name;
    name = name.replace(/<[^<>]*>/g, "\0");
  }
  const letters = Array.from(name.replace(/\0/g, "<…>"));
  if (letters.length <= most) { return name; }
  const tail = Math.floor((most - 1) / 2);
  return letters.slice(0, most - 1 - tail).join("") + "…" + letters.slice(-tail).join("");
}

// Lets a long name break at its punctuation.
function breakable(selection) {
  selection.each(function () {
    const parts = this.textContent.split(/(?<=[^\w\s([{<])(?![\d\s])|(?=[([{<])/);
    this.replaceChildren(...parts.flatMap((part) => [part, document.createElement("wbr")]));
  });
}

// A tooltip follows the pointer and stays within the window.

const tip = document.getElementById("tip");
function showTip(text) {
  const event = d3.event.touches ? d3.event.touches[0] : d3.event;
  tip.textContent = text;
  tip.hidden = false;
  const left = Math.min(event.clientX + 14, window.innerWidth - tip.offsetWidth - 8);
  const above = event.clientY - tip.offsetHeight - 12;
  tip.style.left = Math.max(left, 8) + "px";
  tip.style.top = (above > 8 ? above : event.clientY + 18) + "px";
}
const hideTip = () => { tip.hidden = true; };
function tipFor(selection, text) {
  selection
    .on("mousemove", (datum, i) => showTip(text(datum, i)))
    .on("touchstart", (datum, i) => showTip(text(datum, i)))
    .on("mouseout", hideTip);
}

// An SVG as wide as its place, with a title and a description for screen readers.
function chart(id, height, margin, title, description) {
  const place = byId(id);
  place.selectAll("*").remove();
  const width = Math.max(place.node().clientWidth, 260);
  const svg = place.append("svg")
    .attr({viewBox: `0 0 ${width} ${height}`, height: height, role: "img",
           "aria-label": title, "aria-describedby": id + "-desc"});
  svg.append("desc").attr("id", id + "-desc").text(description);
  return {
    plot: svg.append("g").attr("transform", `translate(${margin.left},${margin.top})`),
    width: width - margin.left - margin.right,
    height: height - margin.top - margin.bottom,
  };
}

function axis(box, scale, orient, ticks, format) {
  const made = d3.svg.axis().scale(scale).orient(orient).ticks(ticks).tickFormat(format)
    .tickPadding(6);
  if (orient === "left") { made.innerTickSize(-box.width).outerTickSize(0); }
  const place = box.plot.append("g").attr("class", orient === "left" ? "axis" : "axis plain");
  if (orient === "bottom") { place.attr("transform", `translate(0,${box.height})`); }
  place.call(made);
}

function label(box, text, x, y, anchor) {
  box.plot.append("text").attr({x: x, y: y, "text-anchor": anchor || "start"}).text(text);
}

// The axis of time, in seconds if the trace has them and the reader has chosen them.

const hasSeconds = data.timeline.seconds.some((value) => value !== null);
let unit = hasSeconds ? "seconds" : "event";

const times = (lines) => lines[unit].map((value) => value || 0);

function timeScale(box, key) {
  const end = key === "event" ? data.events : d3.max(data.timeline.seconds.concat(data.growth.seconds)) || 1;
  return d3.scale.linear().domain([0, end]).range([0, box.width]);
}

function timeAxis(box, x, key) {
  axis(box, x, "bottom", Math.max(2, Math.floor(box.width / 110)), countTick);
  label(box, key === "event" ? "events" : key, box.width, box.height + 36, "end");
}

function unitChoice() {
  if (!hasSeconds) { return; }
  byId("unit").selectAll("button").data(["seconds", "event"]).enter().append("button").attr("type", "button")
    .text((key) => (key === "event" ? "events" : key))
    .on("click", (key) => { unit = key; unitChoice(); growth(); timeline(); });
  byId("unit").selectAll("button").attr("aria-pressed", (key) => String(key === unit));
}

function legend(id, entries, draw) {
  const place = byId(id);
  place.selectAll("*").remove();
  entries.forEach((entry) => {
    const item = place.append("span");
    draw(item.append("svg").attr({width: 22, height: 12, "aria-hidden": "true"}), entry);
    item.append("span").text(entry.name);
  });
}

// A table of plain text. Long names may wrap.
function table(id, heads, rows) {
  const place = byId(id);
  place.append("thead").append("tr").selectAll("th").data(heads).enter().append("th")
    .attr("scope", "col").text(String);
  place.append("tbody").selectAll("tr").data(rows).enter().append("tr")
    .selectAll("td").data((row) => row).enter().append("td").text(String);
  if (heads[0] === "Group") { breakable(place.selectAll("td:first-child").attr("class", "name")); }
}

// Marks a table that is wider than its place as scrollable.
function markWide() {
  d3.selectAll(".scroll").classed("wide", function () { return this.scrollWidth > this.clientWidth; });
}

// The top of the page.

function figure(path) {
  return path.split(".").reduce((value, key) => value[key], data);
}

function heading() {
  const program = data.program || data.trace;
  document.title = "Memory of " + program;
  byId("name").text(program).classed("long", program.length > 50);
  const facts = [];
  if (data.program) { facts.push(data.trace); }
  facts.push(count(data.events) + " events");
  if (data.by) { facts.push("groups by " + data.by); }
  if (data.threads !== null) { facts.push(data.threads + (data.threads === 1 ? " thread" : " threads")); }
  if (data.foreign_frees) { facts.push(count(data.foreign_frees) + " blocks freed by another thread"); }
  if (data.cpu_seconds !== null) { facts.push(`${Number(data.cpu_seconds).toPrecision(3)} s of processor time`); }
  byId("facts").text(facts.join(" · "));

  const banners = [];
  if (data.warning) { banners.push(data.warning); }
  if (data.bad_lines.total > 0) {
    const faults = Object.keys(data.bad_lines.faults)
      .map((fault) => count(data.bad_lines.faults[fault]) + " × " + fault);
    banners.push("Ignored bad lines: " + faults.join(", "));
  }
  byId("banners").selectAll("p").data(banners).enter().append("p").attr("class", "banner").text(String);
}

// "65.1 MB by parse, 20.0 MB by lex": the groups that hold most of the peak, if there are several.
function holders() {
  const shares = data.groups.filter((group) => group.at_peak.bytes >= 0.05 * data.peak.asked).slice(0, 3)
    .map((group) => `${bytes(group.at_peak.bytes)} by ${shortName(group.name, 60)}`);
  if (data.num_groups < 2 || shares.length === 0) { return ""; }
  return ": " + (shares.length > 1 ? shares.slice(0, -1).join(", ") + " and " : "") + shares[shares.length - 1];
}

function verdict() {
  const peak = data.peak;
  const beside = (held) => {
    const ratio = peak.heap_chunks > 0 ? held / peak.heap_chunks - 1 : 0;
    return Math.abs(ratio) < 0.03 ? "about as much as"
      : (100 * Math.abs(ratio)).toFixed(0) + (ratio < 0 ? " % less than" : " % more than");
  };
  const heap = `the heap’s ${bytes(peak.heap_chunks)}`;
  const text = data.blocks === 0 ? "The trace has no block." :
    `At the peak the program has requested ${bytes(peak.asked)} in ${count(peak.blocks)} blocks${holders()}.`;
  byId("verdict").text(text.replace(/(\d) /g, "$1\u00a0"));  // No line break before a unit.
  breakable(byId("verdict"));
  byId("held-note").text("For the blocks at the peak " + (tracedPools > 1
    ? `a pool for each group would hold ${bytes(peak.pools)}, ${beside(peak.pools)} ${heap}; ` +
      `a single pool for all ${bytes(peak.one_pool)}, ${beside(peak.one_pool)} the heap.`
    : `pools would hold ${bytes(peak.pools)}, ${beside(peak.pools)} ${heap}.`));

  const tile = (name, path, show, note) => {
    const place = byId("tiles").append("div");
    place.append("dt").text(name);
    place.append("dd").attr({"data-figure": path, "data-value": figure(path)}).text(show(figure(path)));
    place.append("dd").text(note);
  };
  const ofBlocks = (value) => percent(value, data.blocks);
  tile("Blocks in all", "blocks", count, `of ${bytes(data.bytes)}`);
  tile("Temporary", "temporary", ofBlocks, "of the blocks, freed by the next event of their thread");
  tile("Leaked", "never_bytes", bytes, `in ${count(data.never)} ${data.never === 1 ? "block that is" : "blocks that are"} never freed`);
  tile("Fit into a bucket", "in_records.blocks", ofBlocks, `of the blocks; rounding adds ${percent(data.padding, data.in_records.bytes)} to their bytes`);
  // Rows of four, or of five.
  byId("tiles").classed("many", typeof data.allocation_share === "number");
  if (typeof data.allocation_share === "number") {
    tile("Time in allocation calls", "allocation_share", (share) => percent(share, 1), "of the processor time, estimated" +
      (typeof data.allocation_share_error === "number" ? `, +/- ${percent(data.allocation_share_error, 1)}` : ""));
  }
  byId("settings").text(`buckets of ${data.settings.bucket_size} bytes, records of ` +
    `${data.settings.min_record_size} to ${data.settings.max_record_size}, sizes rounded to ` +
    `${data.settings.data_alignment}, empty buckets ` +
    (data.settings.keep_empty_buckets ? "kept" : "released"));
}

// The advice: the verdict, the lines to set, and a row for the heap and for each of the best settings.

function pools() {
  if (advice === null) { return; }
  byId("no-advice").attr("hidden", "");
  byId("with-advice").attr("hidden", null);
  byId("sentences").selectAll("p").data(advice.sentences).enter().append("p").text(String);
  const lines = Object.keys(advice.environment).map((name) => `export ${name}=${advice.environment[name]}`);
  byId("environment").attr("hidden", lines.length > 0 ? null : "").text(lines.join("\n"));
  const cost = (row) => row.ns_per_event * row.bytes_held;
  const names = advice.settings.map((row, i) =>
    ["fastest", "smallest", "best", "advised"].filter((name) => advice[name] === i).join(", "));
  const order = d3.range(advice.settings.length).sort((a, b) => cost(advice.settings[a]) - cost(advice.settings[b]));
  const shown = order.filter((i, place) => place < 8 || names[i] !== "");
  const figures = (row) => [row.ns_per_event.toFixed(1), (row.ns_per_event / advice.heap.ns_per_event).toFixed(2),
    bytes(row.bytes_held), (row.bytes_held / advice.heap.bytes_held).toFixed(2)];
  const others = [["heap", advice.heap], ["mimalloc", advice.mimalloc]].filter((other) => other[1] !== null);
  table("settings-table", ["Bucket size", "Max record", "Min record", "Alignment", "Empty buckets", "ns per event",
    "Of the heap’s", "Bytes held", "Of the heap’s", ""],
    others.map((other) => [other[0], "", "", "", ""].concat(figures(other[1]), "")).concat(shown.map((i) => {
      const row = advice.settings[i];
      return [count(row.bucket_size), count(row.max_record_size), row.min_record_size, row.data_alignment,
        row.keep_empty_buckets ? "kept" : "released"].concat(figures(row), names[i]);
    })));
  byId("settings-table").selectAll("tbody tr").filter((row) => String(row[9]).includes("advised")).attr("class", "advised");
  const left = advice.settings.length - shown.length;
  byId("settings-note").text(`The trace replayed on ${advice.layer === "mgr" ? "a bare Mgr" : advice.layer === "malloc"
    ? "the pools that mempool try preloads" : "a Heap"}, in turns with the heap.` +
    (left > 0 ? ` ${left} more settings were tried.` : ""));
}

// The advised plan: groups that should share a pool.
function plan() {
  if (advice === null || !advice.plan) { return; }
  byId("plan-part").attr("hidden", null);
  byId("plan").text(advice.plan.sentence);
  const groupsOf = (pool) => pool.groups.slice(0, 4).map((name) => shortName(name, 60)).join(", ") +
    (pool.groups.length > 4 ? ` and ${pool.groups.length - 4} more` : "");
  table("plan-table", ["Group", "Blocks", "Peak", "Calls of FreeAll", "Frees replaced"], advice.plan.pools.map((pool) =>
    [groupsOf(pool), count(pool.blocks), bytes(pool.peak_bytes), count(pool.free_alls), count(pool.frees_replaced)]));
}

// The groups at the peak, a bar each. Groups that are in the chart of live bytes have the same colour.

function peakBars() {
  const shown = data.groups.filter((group, i) => i === 0 || group.at_peak.bytes >= 0.001 * data.peak.asked).slice(0, 12);
  const row = 34;
  const box = chart("peak", Math.max(shown.length, 1) * row, {left: 0, right: 0, top: 0, bottom: 0}, "Bytes at the peak by group",
    shown.map((group) => `${group.name}: ${bytes(group.at_peak.bytes)}`).join(", "));
  const isNarrow = box.width < 480;
  const x = d3.scale.linear().domain([0, data.peak.asked || 1]).range([0, box.width]);
  const bars = box.plot.selectAll("g").data(shown).enter().append("g").attr("transform", (group, i) => `translate(0,${i * row})`);
  bars.append("rect").attr({class: "bar", y: 18, height: 9, rx: 2, width: (group) => Math.max(x(group.at_peak.bytes), 1),
    fill: (group, i) => colours[Math.min(i, colours.length - 1)]});
  bars.append("text").attr({class: "mark", y: 13}).text((group) => shortName(group.name, Math.floor((box.width - (isNarrow ? 110 : 220)) / 7.5)));
  bars.append("text").attr({x: box.width, y: 13, "text-anchor": "end"}).text((group) =>
    `${bytes(group.at_peak.bytes)}, ${percent(group.at_peak.bytes, data.peak.asked)}` +
    (isNarrow ? "" : `, ${count(group.at_peak.blocks)} blocks`));
  tipFor(bars.append("rect").attr({class: "hit", width: box.width, height: row - 2}), (group) =>
    `${group.name}\nAt the peak: ${bytes(group.at_peak.bytes)} in ${count(group.at_peak.blocks)} blocks\n` +
    `In all: ${bytes(group.bytes)} in ${count(group.blocks)} blocks`);
  byId("peak-note").text(shown.length < data.num_groups ? `The ${shown.length} largest of ${count(data.num_groups)}.` : "");
}

// The stacks at the peak as an icicle. A function is one frame, whatever the offsets of its calls. The
// frames of the groups above have their colours.

const functionOf = (frame) => frame.replace(/\+0x[0-9a-f]+(?= \()/, "").replace(/, [^()]*\)$/, ")");

// A frame above all others, which are in `calls`.
function stackTree() {
  const root = {name: "all stacks", bytes: data.peak.asked, calls: []};
  data.stacks.forEach((stack) => stack.frames.map(functionOf).reduce((frame, name) => {
    let call = frame.calls.find((one) => one.name === name);
    if (!call) { frame.calls.push(call = {name: name, bytes: 0, calls: []}); }
    call.bytes += stack.at_peak.bytes;
    return call;
  }, root));
  return root;
}

// All frames from this one on, each with its place.
function placed(frame, from, depth) {
  Object.assign(frame, {from: from, depth: depth});
  return frame.calls.sort((a, b) => b.bytes - a.bytes).reduce((all, call) => {
    const frames = placed(call, from, depth + 1);
    from += call.bytes;
    return all.concat(frames);
  }, [frame]);
}

const stackFrames = data.stacks.length > 0 ? placed(stackTree(), 0, 0) : [];
let widened = stackFrames[0];

function stacks() {
  if (stackFrames.length === 0) { return; }
  byId("stacks-part").attr("hidden", null);
  byId("stacks-note").text(data.stacks.length < data.num_stacks
    ? `The ${count(data.stacks.length)} largest of ${count(data.num_stacks)} stacks.` : "");
  const width = byId("stacks").node().clientWidth;
  const x = d3.scale.linear().domain([widened.from, widened.from + widened.bytes]).range([0, width]).clamp(true);
  const frameWidth = (frame) => x(frame.from + frame.bytes) - x(frame.from);
  const shown = stackFrames.filter((frame) => frameWidth(frame) >= 1);
  const row = 22;
  const box = chart("stacks", (d3.max(shown, (frame) => frame.depth) + 1) * row, {left: 0, right: 0, top: 0, bottom: 0},
    "Bytes at the peak by call stack", `${count(data.num_stacks)} stacks`);
  const colourOf = {};
  data.groups.slice(0, colours.length - 1).forEach((group, i) => {
    if (!(functionOf(group.name) in colourOf)) { colourOf[functionOf(group.name)] = colours[i]; }
  });
  const frames = box.plot.selectAll("g").data(shown).enter().append("g")
    .attr("transform", (frame) => `translate(${x(frame.from)},${frame.depth * row})`);
  tipFor(frames.append("rect").attr({class: "frame", width: frameWidth, height: row})
    .on("click", (frame) => { widened = frame; hideTip(); stacks(); }),
    (frame) => `${frame.name}\n${bytes(frame.bytes)}, ${percent(frame.bytes, data.peak.asked)}`);
  frames.filter((frame) => frame.name in colourOf).append("rect")
    .attr({y: row - 4, width: frameWidth, height: 3, fill: (frame) => colourOf[frame.name]});
  frames.filter((frame) => frameWidth(frame) > 44).append("text").attr({class: "frame-name", x: 4, y: 14})
    .text((frame) => shortName(frame.name.replace(/ \([^()]*\)$/, ""), Math.floor((frameWidth(frame) - 6) / 7)));
}

// Live bytes, the groups stacked, the largest at the bottom. Groups that never hold a hundredth of the
// peak are part of the others.

function growth() {
  const lines = data.growth;
  const points = d3.range(lines.event.length);
  const sums = points.map((i) => lines.others[i] + sum(lines.groups.map((group) => group.bytes[i])));
  const layers = lines.groups.map((group, i) => ({name: group.name, bytes: group.bytes, colour: colours[i]}))
    .filter((layer) => d3.max(layer.bytes) >= 0.01 * d3.max(sums));
  const others = points.map((i) => sums[i] - sum(layers.map((layer) => layer.bytes[i])));
  if (d3.max(others) > 0) { layers.push({name: "all others", bytes: others, colour: colours[colours.length - 1]}); }
  const box = chart("growth", 300, {left: 62, right: 10, top: 22, bottom: 42}, "Live bytes over time by group",
    `At the peak ${bytes(data.peak.asked)} are live.`);
  const x = timeScale(box, unit);
  const y = d3.scale.linear().domain([0, d3.max(sums) || 1]).nice().range([box.height, 0]);
  axis(box, y, "left", 5, bytesTick);
  timeAxis(box, x, unit);
  label(box, "bytes", -6, -10, "end");
  const at = times(lines).map(x);
  const below = points.map(() => 0);
  layers.forEach((layer) => {
    const low = below.slice();
    layer.bytes.forEach((value, i) => { below[i] += value; });
    box.plot.append("path").attr({class: "layer", fill: layer.colour,
      d: d3.svg.area().x((i) => at[i]).y0((i) => y(low[i])).y1((i) => y(low[i] + layer.bytes[i]))(points)});
  });
  pointer(box, at, (i) => [`Event ${count(lines.event[i])}`].concat(hasSeconds ? `${lines.seconds[i] || 0} s` : [],
    `In all: ${bytes(sums[i])}`, layers.map((layer) => `${shortName(layer.name, 40)}: ${bytes(layer.bytes[i])}`)));
  legend("growth-legend", layers.map((layer) => ({name: shortName(layer.name, 48), colour: layer.colour})),
    (svg, entry) => svg.append("rect").attr({width: 12, height: 12, rx: 2, fill: entry.colour}));
  byId("growth-legend").selectAll("svg").attr("width", 12);
}

// A line at the point nearest to the pointer, with its figures.
function pointer(box, at, lines) {
  const cursor = box.plot.append("line").attr({class: "cursor", y1: 0, y2: box.height}).style("display", "none");
  const move = function () {
    const i = Math.min(d3.bisectLeft(at, d3.mouse(this)[0]), at.length - 1);
    cursor.attr({x1: at[i], x2: at[i]}).style("display", null);
    showTip(lines(i).join("\n"));
  };
  box.plot.append("rect").attr({width: box.width, height: box.height, fill: "transparent"})
    .on("mousemove", move).on("touchstart", move).on("touchmove", move)
    .on("mouseout", () => { cursor.style("display", "none"); hideTip(); });
}

// The bytes held. If there are several pools, one pool for all has a line of its own.

const series = [
  {key: "asked", name: "Requested", note: ", and in grey the range within each interval"},
  {key: "heap_chunks", name: "Heap", note: ""},
  {key: "pools", name: tracedPools > 1 ? "Pools, one per group" : "Pools", note: ""},
  {key: "one_pool", name: "One pool for all", note: ""},
].filter((line) => line.key !== "one_pool" || tracedPools > 1);

function timeline() {
  const lines = data.timeline;
  const highest = d3.max(series, (line) => d3.max(lines[line.key])) || 1;
  const box = chart("timeline", 320, {left: 62, right: 10, top: 22, bottom: 42},
    "What pools and the heap would hold",
    `Requested at the peak, event ${count(data.peak.event)}: ${bytes(data.peak.asked)}. ` +
    `Pools hold ${bytes(data.peak.pools)} then, the heap ${bytes(data.peak.heap_chunks)}.`);
  const x = timeScale(box, unit);
  const y = d3.scale.linear().domain([0, highest]).nice().range([box.height, 0]);
  axis(box, y, "left", 5, bytesTick);
  timeAxis(box, x, unit);
  label(box, "bytes", -6, -10, "end");

  const points = d3.range(lines.event.length);
  const places = times(lines).map(x);
  const at = (i) => places[i];
  const area = (low) => d3.svg.area().x(at).y0((i) => y(low(i))).y1((i) => y(lines.asked[i]))(points);
  box.plot.append("path").attr({class: "asked-area", d: area(() => 0)});
  box.plot.append("path").attr({class: "asked-band", d: area((i) => lines.least_asked[i])});
  series.forEach((line) => {
    box.plot.append("path").attr({class: "line " + line.key,
      d: d3.svg.line().x(at).y((i) => y(lines[line.key][i]))(points)});
  });

  const px = x(data.peak[unit] || 0);
  const side = px > box.width - 130 ? -1 : 1;
  box.plot.append("circle").attr({cx: px, cy: y(data.peak.asked), r: 4, fill: "var(--text)"});
  const top = y(d3.max(series, (line) => data.peak[line.key]));
  box.plot.append("text").attr({class: "mark", x: px + 8 * side, y: Math.max(top - 8, -8),
    "text-anchor": side < 0 ? "end" : "start"}).text("peak: requested " + bytes(data.peak.asked));

  pointer(box, places, (i) => [`Event ${count(lines.event[i])}`].concat(series.map((line) =>
    `${line.name}: ${bytes(lines[line.key][i])}`), `Blocks: ${count(lines.blocks[i])}`));

  legend("timeline-legend", series.map((line) => ({key: line.key, name: line.name + line.note})), (svg, line) => {
    if (line.key === "asked") {
      svg.append("rect").attr({class: "asked-area", y: 1, width: 22, height: 11});
      svg.append("rect").attr({class: "asked-band", y: 1, width: 22, height: 5});
    }
    const y = line.key === "asked" ? 1 : 6;
    svg.append("line").attr({class: "line " + line.key, x1: 1, x2: 21, y1: y, y2: y});
  });
}

// Sizes: bins of half a power of two, by their largest size.

function sizeBins() {
  const bounds = [8, 16, 24, 32];
  for (let power = 32; power < Math.pow(2, 30); power *= 2) { bounds.push(power * 1.5, power * 2); }
  const bins = bounds.map((bound, i) =>
    ({from: i === 0 ? 0 : bounds[i - 1] + 1, to: bound, blocks: 0, bytes: 0, records: 0}));
  data.sizes.forEach((row) => {
    const bin = bins[Math.min(d3.bisectLeft(bounds, row.largest), bins.length - 1)];
    bin.blocks += row.blocks;
    bin.bytes += row.bytes;
    bin.records += row.in_records.blocks;
  });
  const used = bins.map((bin) => bin.blocks > 0);
  return bins.slice(used.indexOf(true) < 0 ? 0 : used.indexOf(true), used.lastIndexOf(true) + 1);
}

const sizeTick = (size) =>
  size >= 1048576 ? size / 1048576 + " Mi" : size >= 1024 ? size / 1024 + " Ki" : String(size);

function sizes() {
  const bins = sizeBins();
  const box = chart("sizes", 280, {left: 48, right: 10, top: 22, bottom: 46}, "Blocks and bytes by size",
    "A table behind the chart has the figures.");
  if (bins.length === 0) { return; }
  const x = d3.scale.ordinal().domain(d3.range(bins.length)).rangeBands([0, box.width], 0.2, 0.1);
  const share = (bin, key) => (data[key] > 0 ? bin[key] / data[key] : 0);
  const y = d3.scale.linear().range([box.height, 0])
    .domain([0, d3.max(bins, (bin) => Math.max(share(bin, "blocks"), share(bin, "bytes")))]).nice();
  axis(box, y, "left", 5, (value) => Math.round(1000 * value) / 10 + " %");
  const step = Math.ceil(62 / (box.width / bins.length));
  axis(box, x.copy(), "bottom", 0, (i) => ((bins.length - 1 - i) % step === 0 ? "≤ " + sizeTick(bins[i].to) : ""));
  label(box, "bytes of a block", box.width, box.height + 38, "end");
  label(box, "share", -6, -10, "end");
  ["blocks", "bytes"].forEach((key, side) => {
    box.plot.append("g").selectAll("rect").data(bins).enter().append("rect").attr({
      class: "bar " + key, rx: 1,
      x: (bin, i) => x(i) + side * x.rangeBand() / 2, width: x.rangeBand() / 2,
      y: (bin) => y(share(bin, key)), height: (bin) => box.height - y(share(bin, key))});
  });
  const bound = d3.bisectLeft(bins.map((bin) => bin.to), data.settings.max_record_size - 4);
  if (bound < bins.length - 1) {
    const bx = x(bound) + x.rangeBand() * 1.125;
    box.plot.append("line").attr({class: "bound", x1: bx, x2: bx, y1: -4, y2: box.height});
    const right = bx < box.width / 2;
    label(box, right ? "heap records →" : "← records | heap records", bx + (right ? 5 : -5), -8, right ? "start" : "end");
  }
  tipFor(box.plot.append("g").selectAll("rect").data(bins).enter().append("rect").attr({class: "hit",
    x: (bin, i) => x(i) - x.rangeBand() * 0.125, width: x.rangeBand() * 1.25, height: box.height}),
    (bin) => `${count(bin.from)} to ${count(bin.to)} bytes\nBlocks: ${count(bin.blocks)}, ${percent(bin.blocks, data.blocks)}\n` +
      `Bytes: ${bytes(bin.bytes)}, ${percent(bin.bytes, data.bytes)}\nIn records: ${percent(bin.records, bin.blocks)}`);
  legend("sizes-legend", [{key: "blocks", name: "Share of the blocks"}, {key: "bytes", name: "Share of the bytes"}],
    (svg, entry) => svg.append("rect").attr({class: "bar " + entry.key, width: 22, height: 12, rx: 2}));
}

// Lifetimes.

function lifetimeBins() {
  const bounds = data.lifetime_bounds;
  const power = (bound) => (bound < 1e6 ? count(bound) : countTick(bound));
  const bins = data.lifetimes.map((blocks, i) => ({
    name: i < bounds.length ? "≤ " + power(bounds[i]) : "longer", blocks: blocks, kind: "blocks"}));
  while (bins.length > 1 && bins[bins.length - 1].blocks === 0) { bins.pop(); }
  bins.push({name: "never", blocks: data.never, kind: "never"});
  let before = 0;
  bins.forEach((bin) => { before += bin.blocks; bin.within = before; });
  return bins;
}

function lifetimes() {
  const bins = lifetimeBins();
  const box = chart("lifetimes", 250, {left: 48, right: 10, top: 22, bottom: 42}, "Blocks by lifetime",
    bins.map((bin) => `${bin.name} events: ${percent(bin.blocks, data.blocks)}`).join(", "));
  const x = d3.scale.ordinal().domain(d3.range(bins.length)).rangeBands([0, box.width], 0.3, 0.15);
  const share = (bin) => (data.blocks > 0 ? bin.blocks / data.blocks : 0);
  const y = d3.scale.linear().domain([0, d3.max(bins, share) || 1]).nice().range([box.height, 0]);
  axis(box, y, "left", 4, (value) => Math.round(1000 * value) / 10 + " %");
  const isNarrow = box.width / bins.length < 62;
  axis(box, x, "bottom", 0, (i) => (!isNarrow ? bins[i].name
    : i < data.lifetime_bounds.length && bins[i].kind === "blocks" ? "10" + "⁰¹²³⁴⁵⁶⁷⁸⁹"[i + 1] : bins[i].name));
  label(box, "events between allocation and release", box.width, box.height + 36, "end");
  label(box, "blocks", -6, -10, "end");
  box.plot.append("g").selectAll("rect").data(bins).enter().append("rect").attr({
    class: (bin) => "bar " + bin.kind, rx: 2, x: (bin, i) => x(i), width: x.rangeBand(),
    y: (bin) => y(share(bin)), height: (bin) => box.height - y(share(bin))});
  box.plot.append("g").selectAll("text").data(bins).enter().append("text").attr({class: "mark",
    "text-anchor": "middle", x: (bin, i) => x(i) + x.rangeBand() / 2, y: (bin) => y(share(bin)) - 5})
    .style("font-size", "11px").text((bin) => (bin.blocks > 0 ? (isNarrow ? (100 * share(bin)).toFixed(0) + "%" : percent(bin.blocks, data.blocks)) : ""));
  tipFor(box.plot.append("g").selectAll("rect").data(bins).enter().append("rect").attr({class: "hit",
    x: (bin, i) => x(i), width: x.rangeBand(), height: box.height}),
    (bin) => `${bin.name}${bin.kind === "never" ? " freed" : " events"}\n${count(bin.blocks)} blocks, ${percent(bin.blocks, data.blocks)}` +
      (bin.kind === "never" ? "" : `\nuntil then ${percent(bin.within, data.blocks)}`));
}

// Fill of the size classes as a heat map, with the maximum that each held on the right. Classes that
// never hold a hundredth of the bytes are only in the table.

function fillMap() {
  const columns = data.fill.event;
  const heldAt = (row) => d3.max(row.records) * (row.data_size + 4);
  const all = sum(data.fill.classes.map(heldAt));
  const classes = data.fill.classes.filter((row) => heldAt(row) >= all / 100).reverse();  // The smallest at the bottom.
  const held = (row, i) => row.records[i] * (row.data_size + 4);
  const most = classes.map(heldAt);
  const cell = classes.length > 24 ? 11 : 16;
  const box = chart("fill", classes.length * cell + 64, {left: 48, right: 70, top: 20, bottom: 42},
    "Fill of the size classes over the trace", "A table behind the chart has each class at its fullest.");
  if (classes.length === 0) { return; }
  const style = getComputedStyle(document.documentElement);
  const colour = d3.interpolateLab(style.getPropertyValue("--fill-low").trim(), style.getPropertyValue("--fill-high").trim());
  const x = timeScale(box, "event");
  const cells = [];
  classes.forEach((row, r) => row.records.forEach((records, i) => {
    if (records > 0) { cells.push({row: row, r: r, i: i, fill: row.used[i] / records}); }
  }));
  const from = (i) => x(i === 0 ? 0 : columns[i - 1]);
  tipFor(box.plot.append("g").selectAll("rect").data(cells).enter().append("rect").attr({class: "cell",
    x: (c) => from(c.i), y: (c) => c.r * cell, height: cell - 1,
    width: (c) => Math.max(x(columns[c.i]) - from(c.i) + 0.3, 0.5), fill: (c) => colour(c.fill)}),
    (c) => `Up to ${c.row.data_size} bytes, at event ${count(columns[c.i])}\n` +
      `${count(c.row.used[c.i])} of ${count(c.row.records[c.i])} records used, ${percent(c.row.used[c.i], c.row.records[c.i])}\n` +
      `${bytes(held(c.row, c.i))} in buckets`);
  const step = cell < 14 ? 2 : 1;
  box.plot.append("g").selectAll("text").data(classes).enter().append("text").attr({x: -6, "text-anchor": "end",
    y: (row, r) => r * cell + cell / 2 + 4}).text((row, r) => ((classes.length - 1 - r) % step === 0 ? row.data_size : ""));
  const bar = d3.scale.linear().domain([0, d3.max(most)]).range([0, 60]);
  tipFor(box.plot.append("g").selectAll("rect").data(most).enter().append("rect").attr({class: "bar held",
    x: box.width + 8, y: (value, r) => r * cell + 1, width: (value) => Math.max(bar(value), 1), height: cell - 3}),
    (value, r) => `Up to ${classes[r].data_size} bytes: at most ${bytes(value)} in buckets`);
  label(box, "bytes of a record", -42, -8);
  label(box, "at most", box.width + 8, -8);
  timeAxis(box, x, "event");

  const place = byId("fill-legend");
  place.selectAll("*").remove();
  place.append("span").text("0 %");
  const scale = place.append("svg").attr({width: 120, height: 12, "aria-hidden": "true"});
  d3.range(24).forEach((i) => scale.append("rect").attr({x: 5 * i, width: 5.3, height: 12, fill: colour(i / 23)}));
  place.append("span").text("100 % of the records used");
  place.append("span").text("· at the right: the most bytes in buckets");
}

// The groups, sorted by one column.

const groupColumns = [
  {name: "Group", value: (group) => group.name, text: (group) => group.name, isName: true},
  {name: "At the peak", value: (group) => group.at_peak.bytes, text: (group) => bytes(group.at_peak.bytes),
   share: (group) => (data.at_peak.bytes > 0 ? group.at_peak.bytes / data.at_peak.bytes : 0)},
  {name: "Blocks", value: (group) => group.blocks, text: (group) => count(group.blocks),
   share: (group) => (data.blocks > 0 ? group.blocks / data.blocks : 0)},
  {name: "Bytes", value: (group) => group.bytes, text: (group) => bytes(group.bytes)},
  {name: "Leaked", value: (group) => group.never_bytes, text: (group) => bytes(group.never_bytes)},
  {name: "Temporary", part: (group) => group.temporary},
  {name: "In records", part: (group) => group.in_records.blocks},
  {name: "Padding", value: (group) => group.padding, text: (group) => bytes(group.padding)},
  {name: "Short-lived", part: shortLived},
  {name: "Die together", part: (group) => group.together.blocks},
  {name: "One Clear", part: (group) => group.together.clear_blocks},
].map((column) => (column.part === undefined ? column : {
  name: column.name,
  value: (group) => (group.blocks > 0 ? column.part(group) / group.blocks : -1),
  text: (group) => percent(column.part(group), group.blocks)}));

const shown = {column: 1, ascending: false, rows: 25, filter: ""};

function groups() {
  const column = groupColumns[shown.column];
  const compare = column.isName ? (a, b) => a.name.localeCompare(b.name) : (a, b) => column.value(a) - column.value(b);
  const sign = shown.ascending ? 1 : -1;
  const found = data.groups.filter((group) => group.name.toLowerCase().includes(shown.filter))
    .sort((a, b) => sign * compare(a, b));
  const place = byId("groups");
  place.selectAll("th").attr("aria-sort", (head, i) =>
    (i !== shown.column ? "none" : shown.ascending ? "ascending" : "descending"));
  const body = place.select("tbody");
  body.selectAll("tr").remove();
  body.selectAll("tr").data(found.slice(0, shown.rows)).enter().append("tr")
    .selectAll("td").data((group) => groupColumns.map((one) => ({
      text: one.text(group), isName: one.isName, share: one.share ? one.share(group) : -1})))
    .enter().append("td")
    .attr("class", (one) => (one.isName ? "name" : one.share >= 0 ? "share" : null))
    .style("--share", (one) => (one.share >= 0 ? 100 * one.share + "%" : null))
    .text((one) => one.text);
  breakable(body.selectAll("td.name"));
  markWide();
  const left = found.length - Math.min(found.length, shown.rows);
  byId("groups-more").attr("hidden", left > 0 ? null : "").text(`Show ${count(left)} more`);
  const all = data.num_groups > data.groups.length
    ? `of the ${count(data.groups.length)} largest of ${count(data.num_groups)}` : `of ${count(data.num_groups)}`;
  byId("groups-count").text(`${count(found.length)} ${all}`);
}

function groupsTable() {
  const place = byId("groups");
  place.append("thead").append("tr").selectAll("th").data(groupColumns).enter().append("th")
    .attr("scope", "col").append("button").attr("type", "button").text((column) => column.name)
    .on("click", (column, i) => {
      // Names are sorted from A, figures from the largest.
      shown.ascending = shown.column === i ? !shown.ascending : Boolean(column.isName);
      shown.column = i;
      groups();
    });
  place.append("tbody");
  byId("groups-more").on("click", () => { shown.rows = Infinity; groups(); });
  byId("groups-filter").on("input", function () {
    shown.filter = this.value.toLowerCase();
    groups();
  });
  groups();
}

function tables() {
  const names = {asked: "Requested", pools: "Pools, one per group", one_pool: "One pool for all", heap_chunks: "Heap", heap: "Heap, without its headers"};
  table("held", ["", "At the peak", "Of the heap", "Most at any time"], Object.keys(names).map((key) =>
    [names[key], bytes(data.peak[key]), percent(data.peak[key], data.peak.heap_chunks), bytes(data.most[key])]));
  const rows = data.sizes.slice().sort((a, b) => b.blocks - a.blocks).slice(0, 40);
  table("sizes-table", ["Bytes", "Blocks", "Share", "At the peak", "In records", "Padding", "Freed within 100 events", "Never freed"],
    rows.map((row) => [sizeText(row), count(row.blocks), percent(row.blocks, data.blocks), bytes(row.at_peak.bytes),
      percent(row.in_records.blocks, row.blocks), bytes(row.padding), percent(shortLived(row), row.blocks), percent(row.never, row.blocks)]));
  byId("sizes-note").text(`${count(data.sizes.length)} sizes or ranges of them occur.`);
  table("lifetimes-table", ["Events", "Blocks", "Share", "Until then"],
    lifetimeBins().map((bin) => [bin.name, count(bin.blocks), percent(bin.blocks, data.blocks), percent(bin.within, data.blocks)]));
  const left = data.fill.num_classes - data.fill.classes.length;
  byId("fill-note").text(left > 0 ? `The ${data.fill.classes.length} classes with the most bytes of ${data.fill.num_classes}.` : "");
  const together = data.groups.filter((group) => group.together.blocks > 0)
    .sort((a, b) => b.together.blocks - a.together.blocks).slice(0, 8);
  byId("together-note").text(`${count(data.together.clear_runs)} ${data.together.clear_runs === 1 ? "Clear" : "Clears"} would replace ` +
    `${percent(data.together.clear_blocks, data.frees + data.cleared)} of the releases.`);
  table("together", ["Group", "Die together", "Longest series", "Clears", "Releases replaced", "Of its blocks"], together.map((group) =>
    [group.name, count(group.together.blocks), count(group.together.longest), count(group.together.clear_runs),
      count(group.together.clear_blocks), percent(group.together.clear_blocks, group.blocks)]));
  table("fill-table", ["Bytes of a record", "Records", "Used then", "In buckets"], data.fill.classes.map((row) => {
    const i = row.records.indexOf(d3.max(row.records));
    return [count(row.data_size), count(row.records[i]), percent(row.used[i], row.records[i]), bytes(row.records[i] * (row.data_size + 4))];
  }));
}

function charts() {
  peakBars();
  stacks();
  growth();
  timeline();
  sizes();
  lifetimes();
  fillMap();
  markWide();
}

heading();
verdict();
pools();
plan();
tables();
groupsTable();
unitChoice();
charts();
d3.selectAll("details").on("toggle", markWide);

let drawnWidth = window.innerWidth;
window.addEventListener("resize", () => {
  if (window.innerWidth !== drawnWidth) { drawnWidth = window.innerWidth; hideTip(); charts(); }
});
window.addEventListener("scroll", hideTip, {passive: true});
window.matchMedia("(prefers-color-scheme: dark)").addEventListener("change", charts);
