// Devices by wear, and when a share of them will have reached a limit.
import { dateOf } from '../logs.mjs';
import { normalQuantile } from '../statistics.mjs';

const positive = text => Number(text) > 0 && Number(text) < 1e15 && Number(text);

export const summary = 'devices by wear, and when 1 % of them reach a limit';
export const parameters = {
  key: { help: 'the key of the wear' },
  limit: { help: 'the wear that counts as worn out, in units of the key', fallback: '90', check: positive },
};
export const columns = ['what', 'from', 'to', 'devices', 'share', 'date', 'method'];
export const plot = { x: 'from', y: ['devices'], series: 'what' };

const STEPS = 9; // buckets up to the limit: tenths, with a limit of 90 %
const SHARES = [0.01, 0.1, 0.5];
const SHORTEST = 6; // days between the first and the last of a device that has a line
const NEVER = 1000000; // days

function bucketRows(rows, step, anonymity) {
  const buckets = anonymity.buckets(rows.map(([bucket, devices]) =>
    ({ from: bucket * step, to: (bucket + 1) * step, devices, samples: 0 })), true);
  return buckets.map(({ from, to, devices }) => ['wear', from, to, anonymity.devices(devices), null, null, null]);
}

/**
 * The days until a share has reached the limit. Where that is fewer than K devices, it is taken from the
 * devices' quantiles nearer to the median, as if the logarithms of the days were normally distributed.
 */
function daysOf(share, support, [counted, supported, median]) {
  if (support === share) return [counted, 'counted'];
  if (!(supported > 0 && median < NEVER)) return [null, 'extrapolated'];
  const spread = Math.log(median / supported) / -normalQuantile(support);
  return [median * Math.exp(spread * normalQuantile(share)), 'extrapolated'];
}

export async function answer({ anonymity, query, sql, parameters, last }) {
  const { limit } = parameters;
  const step = limit / STEPS;
  const fits = sql('fits', { values: sql('values', { version: "''" }) });
  const lines = { never: NEVER, shortest: SHORTEST };
  const ofWear = await query('wear', { fits }, { ...lines, step });
  const all = ofWear.reduce((sum, [, devices]) => sum + devices, 0);
  if (all < anonymity.k) {
    anonymity.withheld += all > 0 ? 1 : 0;
    return [];
  }
  const rows = bucketRows(ofWear, step, anonymity);
  for (const share of SHARES) {
    const support = anonymity.supportedLevel(all, share);
    if (support === undefined || (support !== share && support >= 0.5)) {
      anonymity.withheld++;
      continue;
    }
    const [days, method] = daysOf(share, support, (await query('remaining', { fits }, { ...lines, level: share, support }))[0]);
    const date = days === null || days >= NEVER ? null : dateOf(last + Math.round(days));
    rows.push(['reached', limit, null, anonymity.devices(all), share, date, method]);
  }
  return rows;
}
