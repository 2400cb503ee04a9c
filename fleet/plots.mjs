// Answers as plots: SVG for a page of its own that works from a phone's width on, in light and dark.
// All functions are pure, and every text is escaped here.

const WIDTH = 400, HEIGHT = 230;
const LEFT = 46, RIGHT = 8, TOP = 10, BOTTOM = 30;
const INNER = { width: WIDTH - LEFT - RIGHT, height: HEIGHT - TOP - BOTTOM };

export const escaped = text => String(text).replace(/[&<>"']/g, letter => `&#${letter.charCodeAt(0)};`);

const rounded = number => Number(number.toFixed(2));

// "1.5 M"
export function shortNumber(value) {
  if (value === null || !Number.isFinite(Number(value))) return '–';
  const size = Math.abs(value);
  for (const [step, letter] of [[1e12, ' T'], [1e9, ' G'], [1e6, ' M'], [1e4, ' k']]) {
    if (size >= step) return `${Number((value / (step === 1e4 ? 1e3 : step)).toPrecision(3))}${letter}`;
  }
  return String(Number(Number(value).toPrecision(size >= 1000 ? 4 : 3)));
}

// Some round numbers from at or below `low` to at or above `high`.
export function ticks(low, high, about = 5) {
  const span = high > low ? high - low : Math.abs(high) || 1;
  const rough = span / about, power = 10 ** Math.floor(Math.log10(rough));
  const step = [1, 2, 5, 10].map(one => one * power).find(one => one >= rough);
  const first = Math.floor(low / step + 1e-9), last = Math.ceil((low + span) / step - 1e-9);
  return Array.from({ length: last - first + 1 }, (_, index) => Number(((first + index) * step).toPrecision(12)));
}

function axis(values, about) {
  const marks = ticks(Math.min(...values), Math.max(...values), about);
  const low = marks[0], span = marks.at(-1) - low;
  return { marks, part: value => (value - low) / span };
}

const xOf = part => rounded(LEFT + part * INNER.width);
const yOf = part => rounded(TOP + (1 - part) * INNER.height);

const text = (x, y, words, anchor = 'middle', kind = 'label') =>
  `<text class="${kind}" x="${rounded(x)}" y="${rounded(y)}" text-anchor="${anchor}">${escaped(words)}</text>`;

function horizontalGrid({ marks, part }) {
  return marks.map(mark => `<path class="grid" d="M${LEFT} ${yOf(part(mark))}h${INNER.width}"/>` +
    text(LEFT - 5, yOf(part(mark)) + 4, shortNumber(mark), 'end')).join('');
}

// Few enough of the names below the axis that they do not overlap.
function namesBelow(names, place) {
  const every = Math.ceil(names.length / 5);
  return names.map((name, index) => index % every ? '' :
    place(index) > WIDTH - 20 ? text(WIDTH - 1, HEIGHT - 12, name, 'end') : text(place(index), HEIGHT - 12, name)).join('');
}

function svg(title, description, content, height = HEIGHT) {
  return `<svg role="img" aria-label="${escaped(`${title}. ${description}`)}" viewBox="0 0 ${WIDTH} ${height}">` +
    `${content}</svg>`;
}

const legend = names => `<ul class="legend">${names.map((name, index) =>
  `<li><span class="swatch series${index}"></span>${escaped(name)}</li>`).join('')}</ul>`;

// Runs of points without a gap.
function runs(points) {
  const found = [[]];
  points.forEach((point, index) => {
    if (point) found.at(-1).push({ index, ...point });
    else if (found.at(-1).length) found.push([]);
  });
  return found.filter(run => run.length);
}

// A band on a few days alone says nothing, and would take the height from the line.
function withoutRareBand(points) {
  const known = points.filter(Boolean), banded = known.filter(({ low, high }) => low !== null && high !== null);
  return banded.length * 2 > known.length ? points : points.map(point => point && { ...point, low: null, high: null });
}

// names: below the axis. series: [{name, points}], a point for each name: {low, middle, high} or null; low
// and high may be null, and there is no band then.
export function lines({ title, description, names, series: given }) {
  const series = given.map(({ name, points }) => ({ name, points: withoutRareBand(points) }));
  const values = series.flatMap(({ points }) => points.filter(Boolean).flatMap(({ low, middle, high }) =>
    [low, middle, high])).filter(value => value !== null && value !== undefined);
  if (!values.length) return '';
  const scale = axis(values);
  const place = index => xOf(names.length > 1 ? index / (names.length - 1) : 0.5);
  const at = (point, field) => `${place(point.index)} ${yOf(scale.part(point[field]))}`;
  const drawn = series.map(({ points }, number) => runs(points).map(run => {
    const middle = run.map(point => at(point, 'middle'));
    const dot = run.length > 1 ? '' : `<circle class="dot series${number}" r="2.5" ` +
      `cx="${middle[0].split(' ')[0]}" cy="${middle[0].split(' ')[1]}"/>`;
    const known = runs(run.map(point => (point.low === null || point.high === null ? null : point)));
    const band = known.map(part => `<path class="band series${number}" d="M${
      [...part.map(point => at(point, 'high')), ...part.toReversed().map(point => at(point, 'low'))].join('L')}Z"/>`).join('');
    return `${band}<path class="line series${number}" d="M${middle.join('L')}"/>${dot}`;
  }).join('')).join('');
  return svg(title, description, horizontalGrid(scale) + drawn + namesBelow(names, place)) +
    legend(series.map(({ name }) => name));
}

export function bars({ title, description, names, values }) {
  if (!values.length) return '';
  const scale = axis([0, ...values.filter(value => value !== null)]);
  const width = INNER.width / values.length;
  const drawn = values.map((value, index) => value === null ? '' :
    `<rect class="bar series0" x="${rounded(LEFT + index * width + width * 0.1)}" width="${rounded(width * 0.8)}" ` +
    `y="${yOf(scale.part(value))}" height="${rounded(INNER.height * scale.part(value))}"/>`).join('');
  return svg(title, description, horizontalGrid(scale) + drawn +
    namesBelow(names, index => LEFT + (index + 0.5) * width));
}

// rows: [{name, low, middle, high, expected}]; a line at 0, and a diamond at what was expected.
export function intervals({ title, description, rows }) {
  if (!rows.length) return '';
  const step = 46, height = TOP + rows.length * step + BOTTOM, left = 12;
  const values = rows.flatMap(({ low, middle, high, expected }) => [low, middle, high, expected ?? 0]);
  const scale = axis([0, ...values], 4);
  const x = value => rounded(left + scale.part(value) * (WIDTH - left - 16));
  const bottom = height - BOTTOM + 4;
  const grid = scale.marks.map(mark => `<path class="${mark === 0 ? 'zero' : 'grid'}" d="M${x(mark)} ${TOP}` +
    `V${bottom}"/>${text(x(mark), height - 10, shortNumber(mark))}`).join('');
  const drawn = rows.map(({ name, low, middle, high, expected }, index) => {
    const y = TOP + index * step + 30;
    const truth = expected === undefined ? '' :
      `<path class="truth" d="M${x(expected)} ${y - 7}l5 7l-5 7l-5-7Z"/>`;
    return `${text(left, y - 14, name, 'start')}<path class="whisker" d="M${x(low)} ${y}H${x(high)}M${x(low)} ${y - 5}v10` +
      `M${x(high)} ${y - 5}v10"/><circle class="dot series0" cx="${x(middle)}" cy="${y}" r="4.5"/>${truth}`;
  }).join('');
  return svg(title, description, grid + drawn, height);
}

// rows: [{name, share}], shares from 0 to 1, as bars to the right.
export function shares({ title, description, rows }) {
  if (!rows.length) return '';
  const step = 34, height = TOP + rows.length * step, left = 8, room = WIDTH - 70;
  const drawn = rows.map(({ name, share }, index) => {
    const y = TOP + index * step, width = rounded(room * share);
    return `${text(left, y + 9, name, 'start')}<rect class="bar series0" x="${left}" y="${y + 13}" width="${width}" ` +
      `height="13"/>${text(left + width + 6, y + 24, `${Math.round(share * 100)} %`, 'start')}`;
  }).join('');
  return svg(title, description, drawn, height);
}

// A row for each name, a column for each day; shares from 0 to 1, or null where nothing is known.
export function calendar({ title, description, names, days, shares }) {
  if (!days.length) return '';
  const step = 30, height = TOP + names.length * step + BOTTOM, width = (WIDTH - 16) / days.length;
  const rows = names.map((name, row) => text(8, TOP + row * step + 9, name, 'start') + days.map((day, column) => {
    const share = shares[row][column];
    return `<rect class="cell${share === null ? ' withheld' : ''}" x="${rounded(8 + column * width)}" y="${TOP + row * step + 13}" ` +
      `width="${rounded(width * 0.9)}" height="13" fill-opacity="${
      rounded(share ?? 0)}"><title>${escaped(`${day}, ${name}: ${share === null ? 'withheld' :
        `${Math.round(share * 100)} %`}`)}</title></rect>`;
  }).join('')).join('');
  const every = Math.ceil(days.length / 4);
  const below = days.map((day, column) => column % every ? '' :
    text(8 + column * width, height - 10, day, 'start')).join('');
  return svg(title, description, rows + below, height);
}

export function table({ columns, rows }) {
  const cell = value => typeof value === 'number' || value === null ? `<td class="number">${
    escaped(value === null ? '–' : Number.isInteger(value) ? value : Number(value.toPrecision(6)))}</td>` :
    `<td>${escaped(Array.isArray(value) ? value.join(', ') : value)}</td>`;
  return `<div class="wide" tabindex="0"><table><thead><tr>${columns.map((name) =>
    `<th scope="col">${escaped(name.replaceAll('_', ' '))}</th>`).join('')}</tr></thead><tbody>${
    rows.map(row => `<tr>${row.map(cell).join('')}</tr>`).join('')}</tbody></table></div>`;
}

const STYLE = `
:root { color-scheme: light dark; --paper: #fff; --ink: #1c2126; --quiet: #59636e; --rule: #d9dee3;
  --series0: #1f6fb5; --series1: #b8560f; --series2: #4d7a2a; --series3: #8a4fa3; }
@media (prefers-color-scheme: dark) { :root { --paper: #14181c; --ink: #e6eaee; --quiet: #a3adb8; --rule: #333b43;
  --series0: #6db3f2; --series1: #f0a066; --series2: #9ccc65; --series3: #c99be0; } }
* { box-sizing: border-box; }
body { margin: 0; background: var(--paper); color: var(--ink); font: 16px/1.5 system-ui, sans-serif; }
main { max-width: 1200px; margin: 0 auto; padding: 16px; }
h1 { font-size: 1.6rem; line-height: 1.2; margin: .4em 0; } h2 { font-size: 1.15rem; margin: 0 0 .3em; }
p { margin: .3em 0 .8em; } .quiet { color: var(--quiet); }
.answers { display: grid; grid-template-columns: repeat(auto-fit, minmax(min(100%, 440px), 1fr)); gap: 28px; }
section { min-width: 0; border-top: 2px solid var(--rule); padding-top: 12px; }
svg { display: block; width: 100%; max-width: 600px; height: auto; }
.label { fill: var(--quiet); font: 12px system-ui, sans-serif; }
.grid { stroke: var(--rule); } .zero { stroke: var(--quiet); }
.series0 { --tone: var(--series0); } .series1 { --tone: var(--series1); }
.series2 { --tone: var(--series2); } .series3 { --tone: var(--series3); }
.line { fill: none; stroke: var(--tone); stroke-width: 2; } .band { fill: var(--tone); fill-opacity: .18; }
.dot, .bar { fill: var(--tone); } .whisker { fill: none; stroke: var(--series0); stroke-width: 2; }
.truth { fill: none; stroke: var(--series1); stroke-width: 2; }
.cell { fill: var(--series0); stroke: var(--quiet); stroke-opacity: .25; }
.withheld { stroke-dasharray: 2 2; stroke-opacity: 1; }
.legend { list-style: none; display: flex; flex-wrap: wrap; gap: 4px 18px; margin: 4px 0 8px; padding: 0; }
.swatch { display: inline-block; width: 12px; height: 12px; margin-right: 6px; background: var(--tone); }
.wide { overflow-x: auto; } table { border-collapse: collapse; font-size: .85rem; }
th, td { padding: 3px 12px 3px 0; text-align: left; white-space: nowrap; border-bottom: 1px solid var(--rule); }
td.number { text-align: right; font-variant-numeric: tabular-nums; } details { margin: 8px 0; }
summary { cursor: pointer; } @media print { .answers { display: block; } section { break-inside: avoid; } }
`;

// sections: [{heading, text, figure, note, answer}], the last one a table that is folded.
export function page({ title, lead, sections }) {
  const body = sections.map(({ heading, text: words, figure, note, answer }) => `<section><h2>${escaped(heading)}</h2>
<p>${escaped(words)}</p>${figure}${note ? `<p class="quiet">${escaped(note)}</p>` : ''}
<details><summary>The answer as a table</summary>${table(answer)}</details></section>`).join("\n");
  return `<!DOCTYPE html>
<html lang="en"><head><meta charset="utf-8"><meta name="viewport" content="width=device-width, initial-scale=1">
<title>${escaped(title)}</title><style>${STYLE}</style></head>
<body><main><h1>${escaped(title)}</h1><p class="quiet">${escaped(lead)}</p>
<div class="answers">
${body}
</div></main></body></html>
`;
}
