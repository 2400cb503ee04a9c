// How a key is distributed over the fleet, by day and version.
import { coarse } from '../kanonymity.mjs';
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
  const samples = without(({ devices, sampled = 0, merged: [all, , , , largest] = [] }) => sampled === 0 ||
    (anonymity.separable(devices, sampled) && anonymity.sum(sampled, all, largest) !== undefined));
  const buckets = without(({ sampled = 0, bucketed = 0 }) => anonymity.separable(sampled, bucketed));
  return { samples: ({ day }) => !samples.has(day), buckets: ({ day }) => !samples.has(day) && !buckets.has(day) };
}

const nameOfBucket = ({ from, to }) => `${from} ${to}`;

/** Gives the groups of one day, the first of which is of all versions, their histograms. */
function shareBuckets([whole, ...versions], anonymity) {
  const own = versions.map(({ buckets }) => new Map(buckets.map(bucket => [nameOfBucket(bucket), bucket])));
  const cells = whole.buckets.map(({ from, to, devices, samples }) => {
    const parts = own.map(buckets => buckets.get(nameOfBucket({ from, to })) ?? { devices: 0, samples: 0 });
    // What is in no version that is told follows from the others. A device may be in two versions.
    const left = (member, all) => parts.reduce((rest, part) => rest - part[member], all);
    return { from, to, devices, parts: [...parts, { devices: left('devices', devices), samples: left('samples', samples) }] };
  });
  const common = anonymity.commonBuckets(cells);
  [...versions, whole].forEach((group, index) => {
    const samples = bucket => (group === whole ? bucket.samples.reduce((sum, each) => sum + each) : bucket.samples[index]);
    group.histogram = common.map(bucket => ({ ...bucket, samples: samples(bucket) })).filter(bucket => bucket.samples > 0);
  });
}

/** The distance of the quartiles, or of the next quantiles that differ. */
function spreadOf([p1, p5, p25, , p75, p95, p99]) {
  return p75 - p25 || p95 - p5 || p99 - p1;
}

function figuresOf({ sampled, merged: [samples, mean, squares, error, largest, farthest, part] }, anonymity) {
  const { told, size } = anonymity.sum(sampled, samples, largest);
  const variance = Math.max(squares, 0) / samples;
  const deviation = Math.sqrt(variance);
  // What one device may move of the variance makes this of its root.
  const moved = variance > 0 ? Math.max(part, variance * largest) / samples / (2 * deviation) : 0;
  return { size, row: [told, anonymity.figure(mean, farthest / samples, error), anonymity.figure(deviation, moved, 0)] };
}

function rowOf(group, anonymity, told) {
  const { devices, quantiles, histogram } = group;
  const { size, row = [null, null, null] } = group.sampled > 0 && told.samples(group) ? figuresOf(group, anonymity) : {};
  const lists = ['from', 'to', 'samples'].map(part => (histogram.length > 0 && told.buckets(group)
    ? histogram.map(bucket => (part === 'samples' ? coarse(bucket.samples, size) : bucket[part])) : null));
  return [dateOf(group.day), group.version, anonymity.devices(devices),
    ...LEVELS.map((level, index) => anonymity.quantile(devices, level, quantiles[index], spreadOf(quantiles), quantiles[3])), ...row, ...lists];
}

export async function answer(context) {
  const { anonymity } = context;
  const ofVersions = anonymity.release(await groupsOf(context), group => group.devices, group => group.day);
  const ofAll = anonymity.release(await groupsOf(context, "'all'"), group => group.devices, group => group.day);
  const groups = [...ofAll, ...ofVersions];
  const told = tellable(groups, anonymity);
  for (const whole of ofAll) shareBuckets([whole, ...ofVersions.filter(({ day }) => day === whole.day)], anonymity);
  // Those of all versions come first, and stay there.
  return groups
    .sort((one, other) => one.day - other.day || (one.version ?? '').localeCompare(other.version ?? ''))
    .map(group => rowOf(group, anonymity, told));
}
