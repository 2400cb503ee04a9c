// The page: which log, which view, and what is searched for.

const byId = (id) => document.getElementById(id);
const index = JSON.parse(byId("index").textContent);

// A log's data are parsed when it is first shown; the blocks of the others stay text.
const blocks = new Map();
function blockOf(number) {
  if (!blocks.has(number)) {
    const element = byId(`log-${number}`);
    if (!element) return null; // the browser is still reading the file
    const block = JSON.parse(element.textContent);
    prepare(block);
    blocks.set(number, block);
  }
  return blocks.get(number);
}

// Adds what the views and the search look at.
function prepare(block) {
  const none = { key: [], value: [], metric: [], entry: [], former: [], reveal: [] };
  block.scalars = block.scalars || { ...none, range: [] };
  block.distributions = block.distributions || { ...none, histogram: [] };
  block.absent = block.absent || { key: [], kind: [], reason: [], metric: [] };
  block.removed = block.removed || [];
  block.applications = block.applications || null;
  block.scalarCount = block.scalars.key.length;
  block.leaving = block.scalarCount + block.distributions.key.length;
  block.removedKeys = { key: block.removed.map(([, key]) => key), metric: block.removed.map(([, , , metric]) => metric) };
}

// One row of what leaves: scalars come first.
function leavingRow(block, id) {
  const isScalar = id < block.scalarCount;
  const part = isScalar ? block.scalars : block.distributions;
  const i = isScalar ? id : id - block.scalarCount;
  const [, unit, description] = block.metrics[part.metric[i]] || ["", "", ""];
  const row = {
    isScalar, unit, description, key: part.key[i], value: part.value[i], entry: part.entry[i],
    former: block.before ? part.former[i] : true,
    reveal: revealOf(block, part.reveal[i]),
  };
  if (isScalar) row.range = rangeOf(block, row.value, part.range[i]);
  else row.histogram = part.histogram[i];
  return row;
}

// --- The views of a log ---

let current = 0; // the number of the log
let view = null; // of that log: its tables and counts

// The first cell of a row that unfolds.
function keyCell(row, description, withButton) {
  // Long keys break after their parts.
  const name = make("span", { class: "key" });
  for (const part of visibleText(row.key).split(/(?<=[._])/)) name.append(part, make("wbr"));
  const label = withButton ? make("button", { type: "button", class: "fold", "aria-expanded": "false" }, name) : name;
  return make("th", { scope: "row", role: "rowheader" }, label,
    description ? make("span", { class: "description" }, description) : null);
}

function cell(label, text, kind) {
  return make("td", { role: "cell", "data-label": label, class: kind }, text);
}

function statisticsCell(label, statistics, unit) {
  if (!statistics) return cell(label, "damaged", "number warning");
  const [count, minimum, maximum, mean] = statistics;
  return cell(label, make("span", {}, make("span", { class: "strong" }, counted(count, "sample")), make("span", { class: "description" },
    make("span", { class: "whole" }, `${realText(minimum)} to ${withUnit(realText(maximum), unit)},`), " ",
    make("span", { class: "whole" }, `mean ${realText(mean)}`))), "number");
}

function changeCell(block, row) {
  if (!block.before) return cell("Change", "\u2013", "number faint");
  if (row.former === true) return cell("Change", "same", "number faint");
  if (row.former === null) return cell("Change", make("span", { class: "badge" }, "new"), "number");
  return cell("Change", row.isScalar ? differenceText(row.value, row.former) : "changed", "number");
}

function revealCell(row) {
  if (!row.reveal) return cell("Reveals", "\u2013", "number faint");
  const text = `${row.reveal.bits.toFixed(1)} bits`;
  if (!row.reveal.isWarned) return cell("Reveals", text, "number");
  return cell("Reveals", make("span", { class: "badge warned" }, text, make("span", { class: "unseen" }, ", with a warning")), "number");
}

function leavingTable(block) {
  const revealing = block.reveals.length > 0;
  const columns = [{ title: "Key" }, { title: "Reported", class: "number reported" }, { title: "True value", class: "number" },
    { title: "Change", class: "number" }];
  if (revealing) columns.push({ title: "Reveals", class: "number" });
  const table = new LongTable("What leaves: each key with the value that is reported", columns, (id, element) => {
    const row = leavingRow(block, id);
    element.append(keyCell(row, row.description, true));
    if (row.isScalar) {
      element.append(cell("Reported", withUnit(integerText(row.value), row.unit), "number strong"),
        cell("True value", rangeText(row.range), "number"));
    } else {
      element.append(statisticsCell("Reported", row.value, row.unit),
        cell("True value", "not rounded", "number faint"));
    }
    element.append(changeCell(block, row));
    if (revealing) element.append(revealCell(row));
  }, (id, element) => {
    const row = leavingRow(block, id);
    const parts = [make("div", {}), make("div", {})];
    (row.isScalar ? scalarDetails : distributionDetails)(block, row, parts[0]);
    admissionDetails(block, row.entry, parts[1]);
    revealDetails(row, parts[1]);
    element.append(make("div", { class: "unfolded" }, ...parts));
  });
  table.prefix = "leaves";
  return table;
}

function absentTable(block) {
  const { absent } = block;
  const table = new LongTable("What was recorded and does not leave, with the reason",
    [{ title: "Key" }, { title: "Kind", class: "narrow" }, { title: "Why it stays" }], (id, element) => {
      const [, , description] = block.metrics[absent.metric[id]] || ["", "", ""];
      const [name, detail] = block.reasons[absent.reason[id]];
      const { meaning } = index.absences.find((absence) => absence.name === name) || { meaning: name };
      const why = make("td", { role: "cell", "data-label": "Why" }, `${meaning[0].toUpperCase()}${meaning.slice(1)}.`,
        detail ? make("span", { class: "description" }, detail) : null);
      element.append(keyCell({ key: absent.key[id] }, description, false),
        cell("Kind", absent.kind[id] === 0 ? "scalar" : "distribution", "faint"), why);
    }, null);
  table.prefix = "stays";
  return table;
}

function removedTable(block) {
  const table = new LongTable("In the earlier log, and not in this one", [{ title: "Key" }, { title: "Last reported", class: "number" }],
    (id, element) => {
      const [kind, key, value, metric] = block.removed[id];
      const [, unit, description] = block.metrics[metric] || ["", "", ""];
      element.append(keyCell({ key }, description, false), cell("Last reported",
        kind === "scalar" ? withUnit(integerText(value), unit) : statisticsText(value, unit), "number"));
    }, null);
  table.prefix = "gone";
  return table;
}

function aboutPanel(block) {
  const rows = block.facts.map(([name, value, meaning]) => make("tr", {}, make("th", { scope: "row" }, name),
    make("td", { class: "value" }, value), make("td", { class: "faint" }, meaning)));
  const panel = make("div", {}, make("table", { class: "plain" },
    make("caption", {}, "What leaves with the log besides its keys"),
    make("thead", { class: "unseen" }, make("tr", {}, ...["Name", "Value", "Meaning"].map((title) => make("th", { scope: "col" }, title)))),
    make("tbody", {}, ...rows)));
  if (block.applications) {
    const titles = ["Application", "Version", "Store number", "Processor", "UUID"];
    panel.append(make("table", { class: "plain cards" },
      make("caption", {}, `Activated applications, ${block.applications.length}`),
      make("thead", {}, make("tr", {}, ...titles.map((title) => make("th", { scope: "col" }, title)))),
      make("tbody", {}, ...block.applications.map((application) => make("tr", {}, ...application.map((text, i) =>
        i === 0 ? make("th", { scope: "row" }, text || "\u2013") : make("td", { "data-label": titles[i] }, text || "\u2013")))))));
  } else {
    panel.append(make("p", { class: "faint" }, "No list of activated applications is part of this log."));
  }
  return panel;
}

function stopPanel(block) {
  const counts = new Map();
  for (const part of [block.scalars, block.distributions]) {
    for (const entry of part.entry) {
      const group = entry < 0 ? -1 : block.entries[entry][0];
      counts.set(group, (counts.get(group) || 0) + 1);
    }
  }
  const panel = make("div", { class: "stop" });
  panel.append(make("section", { class: "card" }, make("h4", {}, "Everything"),
    make("p", {}, index.submissionAllowed ? "Submission is allowed." : "Submission is not allowed: nothing leaves."),
    index.submissionAllowed ? switchWords(index.submissionSwitch) : null));
  block.groups.forEach(([name, line, note], group) => {
    panel.append(make("section", { class: "card" }, make("h4", {}, "Group ", make("span", { class: "key" }, name)),
      make("p", {}, `Admits ${counted(counts.get(group) || 0, "key")} of this log.`), switchWords([line, note])));
  });
  const others = counts.get(-1) || 0;
  if (others > 0) panel.append(make("p", { class: "faint" }, `Of ${counted(others, "key")} no group is known.`));
  return panel;
}

const VIEWS = [["leaves", "Leaves"], ["stays", "Stays here"], ["gone", "No longer reported"], ["about", "About the log"],
  ["stop", "How to stop it"]];

function buildView(block) {
  view = { block, tables: { leaves: leavingTable(block), stays: absentTable(block), gone: removedTable(block) }, panels: {}, tabs: {} };
  const contents = { about: aboutPanel(block), stop: stopPanel(block) };
  for (const [name, table] of Object.entries(view.tables)) contents[name] = table.element;
  const tabs = [];
  for (const [name, title] of VIEWS) {
    const count = make("span", { class: "number" });
    view.tabs[name] = make("button", { type: "button", role: "tab", id: `tab-${name}`, "aria-controls": `panel-${name}`,
      "data-view": name }, title, " ", count);
    const empty = make("p", { class: "faint empty", hidden: true });
    view.panels[name] = make("section", { role: "tabpanel", id: `panel-${name}`, "aria-labelledby": `tab-${name}`, tabindex: "0" },
      make("h3", { class: "unseen printed" }, title), empty, contents[name]);
    tabs.push(view.tabs[name]);
  }
  byId("tabs").replaceChildren(...tabs);
  byId("panels").replaceChildren(...Object.values(view.panels));
}

function selectView(name, focus) {
  view.name = name;
  for (const [other] of VIEWS) {
    const selected = other === name;
    view.tabs[other].setAttribute("aria-selected", String(selected));
    view.tabs[other].tabIndex = selected ? 0 : -1;
    view.panels[other].hidden = !selected;
  }
  if (focus) view.tabs[name].focus();
  const table = view.tables[name];
  byId("search").hidden = !table;
  if (table) table.measure();
  for (const id of ["filter", "order"]) byId(id).parentElement.hidden = name !== "leaves";
  announce();
}

// --- Search ---

// Which rows have every word, in the key or in what the key's metric and entry say.
function search(keys, tables, words) {
  const lower = keys.lower || (keys.lower = keys.key.map((key) => key.toLowerCase()));
  const hits = words.map((word) => tables.map(([texts, column]) => [texts.map((text) => text.includes(word)), column]));
  const found = [];
  for (let id = 0; id < lower.length; ++id) {
    if (words.every((word, i) => lower[id].includes(word) || hits[i].some(([hit, column]) => hit[column[id]]))) found.push(id);
  }
  return found;
}

// Keys that stay for a rare reason come first: most are just not listed.
function byReason(block, ids) {
  const { reason } = block.absent;
  const counts = {};
  for (const number of reason) counts[block.reasons[number][0]] = (counts[block.reasons[number][0]] || 0) + 1;
  const rank = (id) => counts[block.reasons[reason[id]][0]];
  return ids.sort((a, b) => rank(a) - rank(b) || a - b);
}

function searchTexts(block) {
  if (!block.texts) {
    block.texts = {
      metrics: block.metrics.map((metric) => metric.join("\n").toLowerCase()),
      entries: block.entries.map(([group]) => (group < 0 ? "" : block.groups[group][0].toLowerCase())),
      reasons: (block.reasons || []).map((reason) => reason.join("\n").toLowerCase()),
    };
  }
  return block.texts;
}

const FILTERS = {
  all: ["everything", () => true],
  scalars: ["scalars", (row) => row.isScalar],
  distributions: ["distributions", (row) => !row.isScalar],
  changed: ["what changed", (row) => row.former !== true],
  added: ["what is new", (row) => row.former === null],
  rounded: ["what is rounded", (row) => row.range && row.range.low !== row.range.high],
  exact: ["what is exact", (row) => !row.isScalar || (row.range && row.range.low === row.range.high)],
  warned: ["warnings", (row) => row.reveal && row.reveal.isWarned],
};
const ORDERS = {
  name: ["by name", null],
  reveals: ["most revealing first", (row) => (row.reveal ? -row.reveal.bits : 0)],
  change: ["largest change first", (row) => (row.former === true ? 1 : row.former === null ? 0
    : row.isScalar ? -Math.abs(Number(row.value) - Number(row.former)) : 0)],
};

function fillSelect(id, choices) {
  byId(id).replaceChildren(...Object.entries(choices).map(([value, [title]]) => make("option", { value }, title)));
}

function applySearch() {
  const { block } = view;
  const words = byId("query").value.toLowerCase().split(/\s+/).filter(Boolean);
  const { metrics, entries, reasons } = searchTexts(block);
  const parts = [block.scalars, block.distributions].map((part) => search(part, [[metrics, part.metric], [entries, part.entry]], words));
  let leaving = parts[0].concat(parts[1].map((id) => id + block.scalarCount));
  const [, accepts] = FILTERS[byId("filter").value];
  if (byId("filter").value !== "all") leaving = leaving.filter((id) => accepts(leavingRow(block, id)));
  const [, rank] = ORDERS[byId("order").value];
  if (rank) {
    const ranks = new Map(leaving.map((id) => [id, rank(leavingRow(block, id))]));
    leaving.sort((a, b) => ranks.get(a) - ranks.get(b) || a - b);
  }
  view.found = {
    leaves: leaving,
    stays: byReason(block, search(block.absent, [[metrics, block.absent.metric], [reasons, block.absent.reason]], words)),
    gone: search(block.removedKeys, [[metrics, block.removedKeys.metric]], words),
  };
  view.isSearch = words.length > 0;
  for (const [name, ids] of Object.entries(view.found)) {
    view.tables[name].show(ids);
    view.tabs[name].querySelector(".number").textContent = ids.length.toLocaleString("en-US");
    const empty = view.panels[name].querySelector(".empty");
    empty.hidden = ids.length > 0;
    view.tables[name].element.hidden = ids.length === 0;
    empty.textContent = emptyText(name, block);
  }
  announce();
}

function emptyText(name, block) {
  const total = { leaves: block.leaving, stays: block.absent.key.length, gone: block.removed.length }[name];
  if (total > 0) return "Nothing matches. Other words, or a shorter part of the key, may find more.";
  if (name === "leaves") return "No key leaves with this log.";
  if (name === "stays") return "Nothing that was recorded on this day stays behind, as far as the store still knows.";
  return block.before ? "Every key of the earlier log is in this one too." : "There is no earlier log to compare with.";
}

// Says what was found, also to those who cannot see the table.
function announce() {
  const { block, found, name } = view;
  if (!found || !found[name]) return;
  const total = { leaves: block.leaving, stays: block.absent.key.length, gone: block.removed.length }[name];
  byId("count").textContent = found[name].length === total ? `${counted(total, "key")}`
    : `${found[name].length.toLocaleString("en-US")} of ${counted(total, "key")}`;
}

// --- Which log ---

function showLog(number) {
  const block = blockOf(number);
  if (!block) {
    addEventListener("DOMContentLoaded", () => showLog(number), { once: true });
    return;
  }
  current = number;
  const log = index.logs[number];
  const name = view ? view.name : "leaves";
  [...byId("logs").querySelectorAll("a")].forEach((link, i) => {
    if (i === number) link.setAttribute("aria-current", "page");
    else link.removeAttribute("aria-current");
  });
  byId("title").textContent = log.next ? `The next log: ${dateText(log.date)}` : `Log of ${dateText(log.date)}`;
  byId("state").textContent = stateText(log);
  byId("notes").replaceChildren(...block.notes.map((note) => make("p", { class: "note" }, note)));
  byId("figures").replaceChildren(...figures(block).map(([title, value, hint]) => make("div", {}, make("dt", {}, title),
    make("dd", {}, value, hint ? make("span", { class: "faint" }, ` ${hint}`) : null))));
  buildView(block);
  applySearch();
  selectView(name, false);
}

function stateText(log) {
  if (log.next) return "It has not left. This is what the daily job would submit, made now as a trial.";
  return `Submitted on ${momentText(log.created)}. This left the daily job and waits to be collected.`;
}

function figures(block) {
  let changed = 0;
  for (const part of [block.scalars, block.distributions]) {
    for (const former of part.former) if (former !== true) ++changed;
  }
  const title = index.submissionAllowed || !block.isNext ? "Keys that leave" : "Keys that would leave";
  const list = [[title, block.leaving.toLocaleString("en-US"),
    `${counted(block.scalarCount, "scalar")}, ${counted(block.leaving - block.scalarCount, "distribution")}`],
  ["Recorded, stays here", block.absent.key.length.toLocaleString("en-US"), ""]];
  if (block.before) {
    list.push(["Changed or new", changed.toLocaleString("en-US"), `since ${shortDate(block.before)}`],
      ["No longer reported", block.removed.length.toLocaleString("en-US"), ""]);
  }
  if (block.bits) {
    const [bits, first, last] = block.bits;
    list.push(["Reveals at most", withUnit(bits.toLocaleString("en-US", { maximumFractionDigits: 0 }), "bits"),
      `a day, by what was recorded ${first === last ? `on ${shortDate(first)}` : `from ${shortDate(first)} to ${shortDate(last)}`}`]);
  }
  return list;
}

function buildNavigation() {
  const list = make("ul", {});
  index.logs.forEach((log, number) => {
    const what = log.next ? "would go next" : log.readable ? `${counted(log.keys, "key")}` : "cannot be read";
    list.append(make("li", {}, make("a", { href: `#log-${number}` }, make("strong", {}, shortDate(log.date)),
      make("span", { class: "faint" }, what))));
  });
  byId("logs").append(list);
}

function numberOfAddress() {
  const number = Number((/^#log-(\d+)$/.exec(location.hash) || [])[1]);
  return number < index.logs.length ? number : 0;
}

// --- Theme, printing, keys ---

function applyTheme(theme) {
  if (theme) document.documentElement.dataset.theme = theme;
  else delete document.documentElement.dataset.theme;
  byId("theme").value = theme;
}

// A browser may forbid storage to files; the choice then lasts as long as the page.
function storedTheme(theme) {
  try {
    if (theme === undefined) return localStorage.getItem("theme") || "";
    localStorage.setItem("theme", theme);
  } catch { /* as above */ }
  return "";
}

// On paper every view is there, and what is folded is unfolded as long as it is not too much.
const UNFOLDED_ON_PAPER = 300;
function preparePrint() {
  view.beforePrint = new Set(view.tables.leaves.open);
  const { leaves } = view.tables;
  const ids = leaves.ids.length <= UNFOLDED_ON_PAPER ? leaves.ids : leaves.ids.filter((id) => leaves.open.has(id));
  leaves.open = new Set(ids);
  for (const body of leaves.bodies) body.filled = false;
  for (const panel of Object.values(view.panels)) panel.hidden = false;
  for (const table of Object.values(view.tables)) table.preparePrint();
}

function afterPrint() {
  view.tables.leaves.open = view.beforePrint;
  for (const table of Object.values(view.tables)) {
    table.afterPrint();
    table.show(table.ids);
  }
  selectView(view.name, false);
}

function listen() {
  let timer = 0;
  byId("query").addEventListener("input", () => {
    clearTimeout(timer);
    timer = setTimeout(applySearch, 120);
  });
  for (const id of ["filter", "order"]) byId(id).addEventListener("change", applySearch);
  byId("panels").addEventListener("click", (event) => {
    const row = event.target.closest("button.fold") && event.target.closest("tr");
    if (row) view.tables.leaves.toggle(row);
  });
  byId("tabs").addEventListener("click", (event) => {
    const tab = event.target.closest("[data-view]");
    if (tab) selectView(tab.dataset.view, false);
  });
  byId("tabs").addEventListener("keydown", (event) => {
    const names = VIEWS.map(([name]) => name);
    const at = names.indexOf(view.name);
    const next = { ArrowRight: at + 1, ArrowLeft: at - 1, Home: 0, End: names.length - 1 }[event.key];
    if (next === undefined) return;
    event.preventDefault();
    selectView(names[(next + names.length) % names.length], true);
  });
  document.addEventListener("keydown", (event) => {
    const isTyping = /^(INPUT|SELECT|TEXTAREA)$/.test(event.target.tagName);
    if (event.key !== "/" || isTyping || event.ctrlKey || event.metaKey || event.altKey) return;
    event.preventDefault();
    if (byId("search").hidden) selectView("leaves", false);
    byId("query").focus();
  });
  byId("theme").addEventListener("change", (event) => {
    applyTheme(event.target.value);
    storedTheme(event.target.value);
  });
  byId("print").addEventListener("click", () => print());
  addEventListener("beforeprint", preparePrint);
  addEventListener("afterprint", afterPrint);
  addEventListener("hashchange", () => {
    if (location.hash.startsWith("#log-")) showLog(numberOfAddress());
  });
  addEventListener("resize", () => Object.values(view.tables).forEach((table) => table.resized()));
}

byId("made").textContent = `Made on ${momentText(index.made)} by tallyctl ${index.version}.`;
for (const id of ["tools", "logs", "main", "foot"]) byId(id).hidden = false;
applyTheme(storedTheme());
fillSelect("filter", FILTERS);
fillSelect("order", ORDERS);
buildNavigation();
showLog(numberOfAddress());
listen();
