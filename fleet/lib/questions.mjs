// What can be asked. SQL reduces a fleet to groups; what of them may be told is decided here, by the one
// Anonymity of an answer, and so the same for every engine.
import fs from 'node:fs';
import { statement, template } from './dialect.mjs';
import { Anonymity } from './kanonymity.mjs';
import { dateOf, FleetError } from './logs.mjs';
import * as coverage from './questions/coverage.mjs';
import * as distribution from './questions/distribution.mjs';
import * as regression from './questions/regression.mjs';
import * as silence from './questions/silence.mjs';
import * as wear from './questions/wear.mjs';

export const QUESTIONS = { distribution, regression, wear, silence, coverage };
// Few windows that contain each other, so that nobody can move an end by one day and compare.
const WINDOWS = [7, 28, 91, 364];
const COMMON = {
  days: { help: `the window that ends on the last day: ${WINDOWS.join(', ')}`, fallback: '91',
    check: text => WINDOWS.includes(Number(text)) && Number(text) },
};
const SETTINGS = new URL('../settings.json', import.meta.url);

function kOfSettings() {
  const { K } = JSON.parse(fs.readFileSync(SETTINGS, 'utf8'));
  if (!Number.isSafeInteger(K) || K < 1) throw new FleetError('settings.json: K is not a positive integer');
  return K;
}

/** The parameters of a question: { name: { help, fallback, check } }. */
export const parametersOf = question => ({ ...question.parameters, ...COMMON });

/** Checks what was given and adds what was not. */
export function parametersFrom(name, given) {
  const known = parametersOf(QUESTIONS[name]);
  for (const key of Object.keys(given)) {
    if (!(key in known)) throw new FleetError(`${name} has no parameter ${key}`);
  }
  const values = {};
  for (const [key, { fallback, check }] of Object.entries(known)) {
    const text = given[key] ?? fallback;
    if (text === undefined) throw new FleetError(`${name} needs --param ${key}=…`);
    values[key] = text === '' ? '' : check ? check(text) : text;
    if (values[key] === false || values[key] === undefined || Number.isNaN(values[key])) {
      throw new FleetError(`${name}: ${key} cannot be ${JSON.stringify(text)}`);
    }
  }
  return values;
}

/** Asks an engine; the answer is what `--json` prints. */
export async function ask(engine, name, given) {
  const question = QUESTIONS[name];
  const parameters = parametersFrom(name, given);
  const anonymity = new Anonymity(kOfSettings());
  const values = { ...parameters };
  const sql = (file, pieces = {}) => template(file, { ...engine.tables, ...pieces });
  const query = (file, pieces, more = {}) => engine.query(statement(sql(file, pieces), engine.dialect, { ...values, ...more }));
  const [[last]] = await query('reference', {}, { k: anonymity.k });
  // Fewer than K devices on every day, which one engine says with null and the other with 0.
  const known = last !== null && last !== 0;
  if (known) Object.assign(values, { last, first: Math.max(0, last - parameters.days + 1) });
  const rows = known ? await question.answer({ anonymity, parameters, query, sql, last }) : [];
  return { question: name, engine: engine.dialect, k: anonymity.k, until: known ? dateOf(last) : null,
    columns: question.columns, rows: rows.map(row => row.map(finite)), withheld: anonymity.withheld,
    plot: question.plot };
}

const finite = value => (typeof value === 'number' && !Number.isFinite(value) ? null : value ?? null);
