// Whether a key differs between two versions: for the typical device, for a few devices, and for the same
// device before and after.
import { down, up } from '../kanonymity.mjs';
import { FleetError } from '../logs.mjs';
import { shareDifference, signTest, trimmedDifference } from '../statistics.mjs';

export const summary = 'a key in two versions, and how sure a difference is';
export const parameters = {
  key: { help: 'the key' },
  baseline: { help: 'the former version; the last but one by default', fallback: '' },
  candidate: { help: 'the latter version; the last by default', fallback: '' },
};
export const columns = ['test', 'baseline', 'candidate', 'devices_baseline', 'devices_candidate', 'value_baseline',
  'value_candidate', 'difference', 'low', 'high', 'p_below', 'found'];
export const plot = { x: 'test', y: ['difference'], low: 'low', high: 'high' };

const PROBABILITIES = [0.001, 0.01, 0.05];
const TOP = 0.01; // of the baseline's devices are above the limit of the tail
const FACTOR = 1.5; // a figure that rose or fell by half

/** Whether a difference is found, and how sure; the exact probability would tell counts. */
function verdict(p) {
  const below = PROBABILITIES.find(limit => p < limit);
  return [below ?? null, below !== undefined];
}

async function versionsOf({ query, anonymity, parameters }) {
  const known = anonymity.release(await query('versions'), row => row[1]);
  const given = [parameters.baseline, parameters.candidate];
  for (const version of given) {
    if (version !== '' && !known.some(row => row[0] === version)) return undefined;
  }
  const rest = known.map(row => row[0]).filter(version => !given.includes(version));
  const candidate = parameters.candidate || rest.pop();
  const baseline = parameters.baseline || rest.pop();
  if (baseline !== undefined && baseline === candidate) throw new FleetError('regression: two different versions are needed');
  return baseline === undefined || candidate === undefined ? undefined : { baseline, candidate };
}

function typical(before, after, anonymity) {
  const { one, other, difference, low, high, moved, error, p } = trimmedDifference(before, after);
  const told = (value, round) => anonymity.figure(value, moved, error, round);
  return [told(one), told(other), told(difference), told(low, down), told(high, up), ...verdict(p)];
}

/** Few devices with a multiple of what they had hide behind the mean, but not among the highest. */
async function tail({ anonymity, query, means, versions }, before, after) {
  const limit = { tail: before.tail, slack: Math.abs(before.tail) * 1e-12 };
  const above = new Map(await query('tails', { means }, { ...versions, ...limit }));
  const counts = [above.get(before.version) ?? 0, above.get(after.version) ?? 0];
  const { low, high, p } = shareDifference(counts[0], before.devices, counts[1], after.devices);
  const share = anonymity.share(counts[1], after.devices);
  if (share === null) return [null, null, null, null, null, ...verdict(p)];
  const bounds = [anonymity.bound(low, after.devices, Math.floor), anonymity.bound(high, after.devices, Math.ceil)];
  // The baseline's share is 1 % by the choice of the limit, and says nothing of its devices.
  return [TOP, share, share - TOP, ...bounds, ...verdict(p)];
}

async function pairs({ anonymity, query, means, versions }) {
  const [[both, rose, fell]] = await query('pairs', { means }, { ...versions, factor: FACTOR });
  if (both < anonymity.k) return undefined;
  const shares = [anonymity.share(fell, both), anonymity.share(rose, both)];
  // One group the fewer of which are few is told as one that has none.
  const difference = shares[1] ?? (shares[0] === null ? null : -shares[0]);
  return { both, row: [...shares, difference, null, null, ...verdict(signTest(rose, fell))] };
}

const groupOf = ([version, devices, top, middle, cut, least, greatest, sum, squares]) =>
  ({ version, devices, tail: top, middle, cut, least, greatest, sum, squares });

export async function answer(context) {
  const { anonymity, query, sql } = context;
  const versions = await versionsOf(context);
  if (versions === undefined) return [];
  const means = sql('means', { values: sql('values', { version: 'version' }) });
  const groups = (await query('regression', { means }, versions)).map(groupOf);
  const names = [versions.baseline, versions.candidate];
  const [before, after] = names.map(version => groups.find(group => group.version === version));
  const head = test => [test, ...names];
  const devices = [before, after].map(group => anonymity.devices(group.devices));
  const compared = { ...context, means, versions };
  const rows = [
    [...head('typical'), ...devices, ...typical(before, after, anonymity)],
    [...head('tail'), ...devices, ...await tail(compared, before, after)],
  ];
  const paired = await pairs(compared);
  if (paired === undefined) anonymity.withheld++;
  else rows.push([...head('paired'), anonymity.devices(paired.both), anonymity.devices(paired.both), ...paired.row]);
  return rows;
}
