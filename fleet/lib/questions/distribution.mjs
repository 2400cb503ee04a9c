// How a key is distributed over the fleet, by day and version.
import { dateOf } from '../logs.mjs';

const LEVELS = [0.01, 0.05, 0.25, 0.5, 0.75, 0.95, 0.99];

export const summary = 'a key over the fleet, by day and version';
export const parameters = { key: { help: 'the key' } };
export const columns = ['date', 'version', 'devices', 'p1', 'p5', 'p25', 'p50', 'p75', 'p95', 'p99',
  'samples', 'mean', 'deviation', 'lower', 'upper', 'counts'];
export const plot = { x: 'date', y: ['p5', 'p25', 'p50', 'p75', 'p95'], series: 'version' };

const ALL = null; // the version of a row about all versions
const nameOf = (day, version) => `${day} ${version}`;

async function groupsOf({ query, sql }, version) {
  const pieces = { version: version ?? 'version' };
  const value = text => (version ? ALL : text);
  const groups = new Map();
  for (const [day, text, devices, ...quantiles] of await query('distribution', { values: sql('values', pieces) })) {
    groups.set(nameOf(day, value(text)), { day, version: value(text), devices, quantiles, buckets: [] });
  }
  const merged = await query('merged', { samples: sql('samples', pieces) });
  for (const [day, text, devices, ...figures] of merged) {
    Object.assign(groups.get(nameOf(day, value(text))), { sampled: devices, merged: figures });
  }
  if (merged.length > 0) {
    const buckets = sql('buckets', pieces);
    for (const [day, text, devices] of await query('bucketed', { buckets })) {
      groups.get(nameOf(day, value(text))).bucketed = devices;
    }
    for (const [day, text, from, to, devices, samples] of await query('histogram', { buckets })) {
      groups.get(nameOf(day, value(text))).buckets.push({ from, to, devices, samples });
    }
  }
  return [...groups.values()];
}

/** The days of which samples may be told, and of which histograms: not if a subtraction shows few devices. */
function tellable(groups, anonymity) {
  const without = condition => new Set(groups.filter(group => !condition(group)).map(({ day }) => day));
  const samples = without(({ devices, sampled = 0 }) => anonymity.separable(devices, sampled));
  const buckets = without(({ sampled = 0, bucketed = 0 }) => anonymity.separable(sampled, bucketed));
  return { samples: ({ day }) => !samples.has(day), buckets: ({ day }) => !samples.has(day) && !buckets.has(day) };
}

const bound = (value, open) => value ?? open;

function rowOf(group, anonymity, told) {
  const { devices, sampled = 0, merged: [samples, mean, squares] = [] } = group;
  const buckets = anonymity.buckets(group.buckets.sort((one, other) =>
    bound(one.to, Infinity) - bound(other.to, Infinity) || bound(one.from, -Infinity) - bound(other.from, -Infinity)), false);
  const lists = ['from', 'to', 'samples'].map(part =>
    (buckets.length > 0 && told.buckets(group) ? buckets.map(bucket => bucket[part]) : null));
  return [dateOf(group.day), group.version, anonymity.devices(devices),
    ...LEVELS.map((level, index) => anonymity.quantile(devices, level, group.quantiles[index])),
    ...[samples, mean, Math.sqrt(squares / samples)].map(value =>
      (told.samples(group) ? anonymity.value(sampled, value) : null)), ...lists];
}

export async function answer(context) {
  const { anonymity } = context;
  const ofVersions = anonymity.release(await groupsOf(context), group => group.devices, group => group.day);
  const ofAll = anonymity.release(await groupsOf(context, "'all'"), group => group.devices, group => group.day);
  const groups = [...ofAll, ...ofVersions];
  const told = tellable(groups, anonymity);
  // Those of all versions come first, and stay there.
  return groups
    .sort((one, other) => one.day - other.day || (one.version ?? '').localeCompare(other.version ?? ''))
    .map(group => rowOf(group, anonymity, told));
}
