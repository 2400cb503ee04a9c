#!/usr/bin/env node
// report.mjs DIR: prints the answers in DIR/answers as tables and draws them in DIR/fleet.html, beside
// what the simulation put into the fleet (DIR/truths.json).
import fs from 'node:fs';
import path from 'node:path';
import { tableOf } from '../lib/table.mjs';
import { bars, calendar, intervals, lines, page, shares } from '../plots.mjs';

const directory = process.argv[2];
const json = name => JSON.parse(fs.readFileSync(path.join(directory, name), 'utf8'));
const truths = json('truths.json');
const ROWS_SHOWN = 6; // of an answer by days on a terminal

/** The rows of an answer as objects. */
const rowsOf = ({ columns, rows }) => rows.map(row => Object.fromEntries(row.map((value, index) => [columns[index], value])));
const unique = values => [...new Set(values)].sort();
const monthAndDay = date => date.slice(5);
const percent = share => `${Number((share * 100).toFixed(1))} %`;
const versionsOf = rows => unique(rows.map(({ version }) => version).filter(version => version !== null));

function byDay(answer, title) {
  const rows = rowsOf(answer).filter(({ p50 }) => p50 !== null);
  const dates = unique(rows.map(({ date }) => date));
  const at = new Map(rows.map(row => [`${row.version} ${row.date}`, row]));
  const series = [null, ...versionsOf(rows)].map(version => ({ name: version ?? 'all versions', points: dates.map(date => {
    const row = at.get(`${version} ${date}`);
    return row && { low: row.p25, middle: row.p50, high: row.p75 };
  }) }));
  return lines({ title, description: 'Median and quartiles of the devices', names: dates.map(monthAndDay), series });
}

function regressionFigures(answer) {
  const { wakeups, updated_devices: updated } = truths;
  const told = rowsOf(answer).filter(({ low }) => low !== null);
  const typical = told.filter(({ test }) => test === 'typical').map(({ low, difference, high }) =>
    ({ name: 'typical device: wake-ups a day', low, middle: difference, high, expected: 0 }));
  const tail = told.filter(({ test }) => test === 'tail').map(({ low, difference, high }) =>
    ({ name: 'devices above the former 99th percentile: %', low: low * 100, middle: difference * 100,
      high: high * 100, expected: wakeups.affected_devices / updated * 100 }));
  return [typical, tail].map(rows => intervals({ title: 'Difference of the versions',
    description: '95 % intervals; a diamond is what was simulated', rows })).join('');
}

function foundWords(answer) {
  return rowsOf(answer).map(({ test, found, p_below: p }) =>
    `${test}: ${found ? `a difference, p < ${p}` : 'no difference found'}`).join('; ');
}

function wearFigure(answer) {
  const buckets = rowsOf(answer).filter(({ what }) => what === 'wear');
  return bars({ title: 'Devices by wear', description: 'in percent of what a disk is made for',
    names: buckets.map(({ from, to }) => (from === null ? `below ${to ?? '…'} %` : to === null ? `from ${from} %` : `${from}–${to} %`)), values: buckets.map(({ devices }) => devices) });
}

function wearWords(answer) {
  const dates = rowsOf(answer).filter(({ what, date }) => what === 'reached' && date !== null).map(({ share, date, method }) =>
    `${percent(share)} of the devices on ${date} (${method})`);
  return dates.length ? `At ${truths.wear.percent} %: ${dates.join('; ')}.` : 'When devices will be worn out is withheld.';
}

function coverageFigure(answer) {
  const rows = rowsOf(answer).filter(({ date, devices }) => date !== null && devices !== null);
  const dates = unique(rows.map(({ date }) => date));
  const names = [null, ...versionsOf(rows)];
  const most = Math.max(...rows.map(({ devices }) => devices));
  const at = new Map(rows.map(({ version, date, devices }) => [`${version} ${date}`, devices]));
  return calendar({ title: 'Devices that reported', description: 'as a share of the most on one day',
    names: names.map(version => version ?? 'all versions'), days: dates.map(monthAndDay),
    shares: names.map(version => dates.map(date => (at.has(`${version} ${date}`) ? at.get(`${version} ${date}`) / most : null))) });
}

const dayText = day => new Date(day * 86400000).toISOString().slice(0, 10);

const SECTIONS = {
  start: answer => ({ heading: 'How long the player takes to start', text: 'The means of the devices in milliseconds, by day and version: median, and the band from quartile to quartile where it may be told.',
    figure: byDay(answer, 'Start of the player') }),
  wakeups: answer => ({ heading: 'Wake-ups by the radio', text: 'Per device and day, by version: median, and the band from quartile to quartile where it may be told.',
    figure: byDay(answer, 'Wake-ups by the radio'),
    note: `Simulated: the new version doubles them on ${truths.wakeups.affected_devices} of ${truths.devices} devices, too few to move a median.` }),
  regression: answer => ({ heading: 'Does the new version wake devices more often?', text: foundWords(answer),
    figure: regressionFigures(answer),
    note: 'The dot is the estimate with its 95 % interval, the diamond what was simulated. Numbers that would tell of fewer than K devices are withheld.' }),
  wear: answer => ({ heading: 'Wear of the flash storage', text: wearWords(answer), figure: wearFigure(answer),
    note: `Simulated: ${percent(truths.wear.share)} of the devices reach ${truths.wear.percent} % on ${dayText(truths.wear.day)}.` }),
  silence: answer => ({ heading: 'Keys that stopped arriving', text: 'The share of the devices that sent a key and no longer do, although they still report.',
    figure: shares({ title: 'Keys that stopped arriving', description: 'Share of devices',
      rows: rowsOf(answer).map(({ key, share }) => ({ name: key, share })) }),
    note: `Simulated: the new version no longer records ${truths.stopped_key}.` }),
  coverage: answer => ({ heading: 'Who reported', text: 'Devices by day and version, as a share of the most on one day.', figure: coverageFigure(answer),
    note: `Simulated: ${truths.lost_logs} lost logs, ${truths.repeated_logs} that arrive twice, ${truths.late_logs} that are late, ` +
      `${truths.silent_devices} devices that fall silent, ${truths.wrong_clocks} with a wrong clock.` }),
};

const sections = Object.entries(SECTIONS).map(([name, sectionOf]) => {
  const answer = json(`answers/${name}.json`);
  const section = { ...sectionOf(answer), answer };
  const shown = answer.rows.length > 2 * ROWS_SHOWN ? { ...answer, rows: answer.rows.slice(-ROWS_SHOWN) } : answer;
  const left = answer.rows.length - shown.rows.length;
  process.stdout.write(`\n${section.heading}: ${section.text}\n${tableOf(shown)}\n${left ? `(${left} rows before these)\n` : ''}`);
  return section;
});
fs.writeFileSync(path.join(directory, 'fleet.html'), page({
  title: `A fleet of ${truths.devices} devices in ${truths.days} days`,
  lead: `Simulated from ${dayText(truths.first_day)} on: made by the daily job itself, exported, and asked with DuckDB. Answers about fewer than ${
    json('answers/coverage.json').k} devices are withheld.`,
  sections,
}));
