// Keys that devices no longer send although they still report.
import { dateOf } from '../logs.mjs';

export const summary = 'keys that stopped arriving';
export const parameters = {};
export const columns = ['key', 'senders', 'silent', 'share', 'last'];
export const plot = { x: 'key', y: ['share'] };

const RECENT = 7; // days without the key, and with a log

export async function answer({ anonymity, query, last }) {
  const found = await query('silence', {}, { recent: last - RECENT + 1, k: anonymity.k });
  return anonymity.release(found, ([, , silent]) => silent, ([key]) => key)
    .sort((one, other) => other[2] / other[1] - one[2] / one[1] || (one[0] < other[0] ? -1 : 1))
    .map(([key, senders, silent, day]) => {
      const [all, some] = [anonymity.devices(senders), anonymity.devices(silent)];
      return [key, all, some, some / all, day > 0 ? dateOf(day) : null];
    });
}
