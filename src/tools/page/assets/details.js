// What a row shows when it is unfolded.

function paragraph(text, attributes) {
  return make("p", attributes || {}, text);
}

// A line breaks between its words alone, not at the hyphens of an option.
function command(text) {
  const line = make("code", { class: "command" });
  text.split(" ").forEach((word, i) => line.append(i > 0 ? " " : "", make("span", {}, word)));
  return line;
}

// How a group, or all submission, is switched off; the switch is [command, note].
function switchWords([line, note]) {
  return line ? make("div", { class: "switch" }, command(line), paragraph(note, { class: "faint" }))
    : paragraph(note, { class: "faint" });
}

function admissionDetails(block, entry, cell) {
  cell.append(make("h4", {}, "Why it leaves, and how to stop it"));
  if (entry < 0) {
    cell.append(paragraph(block.sameWhitelist ? "By the whitelist as it is in force now, it would not leave any more."
      : "Which entry of the whitelist admitted it is not known."));
    return;
  }
  const [group, prefix, , options] = block.entries[entry];
  if (group < 0) {
    cell.append(paragraph("No group lists it: it leaves because this is an internal device."));
    return;
  }
  const [name, line, note] = block.groups[group];
  const text = make("p", {}, "The group ", make("strong", {}, name), prefix === null ? " lists this key"
    : " lists all keys that begin with ", prefix === null ? null : make("code", {}, prefix), `, with ${options}.`);
  cell.append(text, switchWords([line, note]));
}

// What was measured of a key over the days of the store; null where nothing was.
function revealOf(block, number) {
  if (number === undefined || number < 0) return null;
  const [bits, days, range, values, reports, exposure] = block.reveals[number];
  const [notes, proposals] = block.exposures[exposure];
  return { bits, days, range, values, reports, notes, proposals, isWarned: notes.some(([warns]) => warns) };
}

function revealDetails(row, cell) {
  const { reveal } = row;
  if (!reveal) return;
  const kind = row.isScalar ? "values" : "samples";
  cell.append(make("h4", {}, "What it can reveal"),
    paragraph(`At most ${reveal.bits.toFixed(1)} bits a day, over the range that was seen: ` +
      `${withUnit(reveal.range, row.unit)}, on ${counted(reveal.days, "day")}. Different ${kind} recorded: ` +
      `${reveal.values}; different reports: ${reveal.reports}.`));
  if (reveal.notes.length > 0) {
    cell.append(make("ul", { class: "remarks" }, ...reveal.notes.map(([warns, text]) =>
      make("li", { class: warns ? "warning" : null }, text))));
  }
  if (reveal.proposals.length > 0) {
    cell.append(paragraph("Whoever writes the whitelist could make its entry reveal less:"),
      make("ul", { class: "remarks" }, ...reveal.proposals.map((text) => make("li", {}, text))));
  }
}

function scalarDetails(block, row, cell) {
  const value = integerText(row.value);
  cell.append(make("h4", {}, "What leaves"));
  const rounding = row.entry >= 0 ? block.entries[row.entry][2] : "";
  const text = make("p", {}, "The number ", make("strong", {}, withUnit(value, row.unit)));
  text.append(row.entry < 0 ? "." : rounding ? `, ${rounding}.` : ", not rounded.");
  cell.append(text, paragraph(rangeSentence(row.range, row.unit, rounding)));
  formerDetails(block, row, cell, (former) => withUnit(integerText(former), row.unit));
}

function formerDetails(block, row, cell, words) {
  if (!block.before) return;
  const day = dateText(block.before);
  if (row.former === true) cell.append(paragraph(`The same as in the log of ${day}.`));
  else if (row.former === null) cell.append(paragraph(`It was not in the log of ${day}.`));
  else cell.append(paragraph(`In the log of ${day}: ${words(row.former)}.`));
}

function statisticsText(statistics, unit) {
  if (!statistics) return "damaged";
  const [count, minimum, maximum, mean] = statistics;
  return `${counted(count, "sample")}, ${realText(minimum)} to ${withUnit(realText(maximum), unit)}, ` +
    `mean ${realText(mean)}`;
}

function distributionDetails(block, row, cell) {
  cell.append(make("h4", {}, "What leaves"));
  if (!row.value) {
    cell.append(paragraph("Its statistics are damaged."));
  } else {
    const [count, minimum, maximum, mean, deviation] = row.value;
    cell.append(paragraph("Five numbers about the samples, not rounded. The smallest and the largest are " +
      "samples themselves."));
    const facts = [["Samples", integerText(count)], ["Smallest", minimum], ["Largest", maximum], ["Mean", mean],
      ["Standard deviation", deviation]];
    cell.append(make("dl", { class: "facts" }, ...facts.map(([name, number]) => make("div", {}, make("dt", {}, name),
      make("dd", {}, typeof number === "string" ? number : withUnit(String(number), row.unit))))));
  }
  if (row.histogram) cell.append(histogram(row));
  formerDetails(block, row, cell, (former) => statisticsText(former, row.unit));
}

// Buckets that have samples, from top to bottom, each with its bounds, a bar and its share.
function histogram(row) {
  const counts = row.histogram.map(([, count]) => Number(count) || 0);
  const most = Math.max(...counts, 1);
  const total = counts.reduce((sum, count) => sum + count, 0) || 1;
  const rows = row.histogram.map(([label, count], index) => {
    const share = counts[index] / most;
    const bar = makeSvg("svg", { class: "bar", viewBox: "0 0 100 10", preserveAspectRatio: "none", "aria-hidden": "true" },
      makeSvg("rect", { class: "track", width: 100, height: 10 }),
      makeSvg("rect", { class: "fill", width: (counts[index] > 0 ? Math.max(share * 100, 0.7) : 0).toFixed(2), height: 10 }));
    return make("tr", {}, make("th", { scope: "row" }, bucketWords(label, row.unit)), make("td", { class: "bars" }, bar),
      make("td", { class: "number" }, count === null ? "damaged" : integerText(count)),
      make("td", { class: "number faint" }, `${(counts[index] / total * 100).toFixed(1)} %`));
  });
  return make("table", { class: "histogram" }, make("caption", {}, "Histogram: samples by value"),
    make("thead", { class: "unseen" }, make("tr", {}, make("th", { scope: "col" }, "Values"), make("th", { scope: "col" }, "Bar"),
      make("th", { scope: "col" }, "Samples"), make("th", { scope: "col" }, "Share"))),
    make("tbody", {}, ...rows));
}
