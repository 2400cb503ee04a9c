// Devices by wear, and when a share of them will have reached a limit.
import { coarse } from '../kanonymity.mjs';
import { dateOf } from '../logs.mjs';
import { normalQuantile } from '../statistics.mjs';

// Limits of one's own choice would move dates and buckets over single devices.
const oneDigit = text => /^[1-9]0{0,14}$/.test(text) && Number(text);

export const summary = 'devices by wear, and when 1 % of them reach a limit';
export const parameters = {
  key: { help: 'the key of the wear' },
  limit: { help: 'the wear that counts as worn out, in units of the key: one digit and zeros', fallback: '90', check: oneDigit },
};
export const columns = ['what', 'from', 'to', 'devices', 'share', 'date', 'method'];
export const plot = { x: 'from', y: ['devices'], series: 'what' };

const SHARES = [0.01, 0.1, 0.5];
const SHORTEST = 6; // days between the first and the last of a device that has a line
const NEVER = 1000000; // days
const PRECISION = 0.02; // of the days until then: a quantile is one device's

/** The width of buckets: a tenth of a power of ten, so that buckets of all limits have the same bounds. */
const stepOf = limit => 10 ** Math.max(Math.ceil(Math.log10(limit)) - 1, 0);

/** Devices by wear, up to the limit and above, without a lowest and a highest. */
function bucketRows(rows, limit, anonymity) {
  const step = stepOf(limit);
  const cells = Array.from({ length: Math.round(limit / step) + 1 }, (_, index) =>
    ({ from: index * step, to: (index + 1) * step, devices: 0 }));
  for (const [bucket, devices] of rows) cells[Math.min(Math.max(bucket, 0), cells.length - 1)].devices += devices;
  cells[0].from = null;
  cells.at(-1).to = null;
  return anonymity.joined(cells).map(({ from, to, devices }) => ['wear', from, to, anonymity.devices(devices), null, null, null]);
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
  const fits = sql('fits', { values: sql('values', { version: "''" }) });
  const lines = { never: NEVER, shortest: SHORTEST };
  const ofWear = await query('wear', { fits }, { ...lines, step: stepOf(limit) });
  const all = ofWear.reduce((sum, [, devices]) => sum + devices, 0);
  if (all < anonymity.k) {
    anonymity.withheld += all > 0 ? 1 : 0;
    return [];
  }
  const rows = bucketRows(ofWear, limit, anonymity);
  for (const share of SHARES) {
    const support = anonymity.supportedLevel(all, share);
    if (support === undefined || (support !== share && support >= 0.5)) {
      anonymity.withheld++;
      continue;
    }
    const [days, method] = daysOf(share, support, (await query('remaining', { fits }, { ...lines, level: share, support }))[0]);
    const date = days === null || days >= NEVER ? null : dateOf(last + Math.round(coarse(days, Math.abs(days) * PRECISION)));
    rows.push(['reached', limit, null, anonymity.devices(all), share, date, method]);
  }
  return rows;
}
