#!/usr/bin/env node
// generate.mjs DIR DEVICES DAYS KEYS: exported rows of a fleet whose truths are known, the same ones each
// time. Version 2.0 arrives for each device in the middle; with it 3 % of the devices wake up twice as
// often, and "fleet.silent" stops. "fleet.wear" grows by 0.02 to 0.06 a day. A tenth of the keys are
// distributions with a histogram.
import fs from 'node:fs';
import path from 'node:path';

export const LAST_DAY = 20783;

/** Numbers in [0, 1) that look random. */
export function randomNumbers(seed) {
  let state = seed >>> 0;
  return () => {
    state = (state + 0x6d2b79f5) >>> 0;
    let mixed = Math.imul(state ^ (state >>> 15), state | 1);
    mixed ^= mixed + Math.imul(mixed ^ (mixed >>> 7), mixed | 61);
    return ((mixed ^ (mixed >>> 14)) >>> 0) / 2 ** 32;
  };
}

export function header(device, sequence, day, version) {
  return { schema: 1, device: device.toString(16).padStart(32, '0'), sequence, day,
    date: new Date(day * 86400000).toISOString().slice(0, 10), system_version: version, configuration: null,
    log_version: 1, whitelist: '0123456789abcdef0123456789abcdef' };
}

export function logOf(device, number, days, keys, random) {
  const late = number >= days / 2;
  const head = JSON.stringify(header(device, number + 1, LAST_DAY - days + 1 + number, late ? '2.0' : '1.0'))
    .slice(0, -1);
  const lines = [];
  const scalar = (key, value) => lines.push(`${head},"key":"${key}","kind":"scalar","value":"${Math.round(value)}"}`);
  const rate = 0.02 + 0.04 * ((device * 7919) % 1000) / 1000;
  scalar('fleet.wear', 1000 * (20 + rate * number));
  scalar('fleet.wakeups', (500 + (device % 97) + 40 * random()) * (late && device % 33 === 0 ? 2 : 1));
  if (!late) scalar('fleet.silent', 1);
  const distributions = Math.ceil(keys / 10);
  for (let key = lines.length; key < keys - distributions; ++key) scalar(`fleet.scalar.${key}`, 1e6 * random());
  for (let key = 0; key < distributions; ++key) {
    const counts = [1 + Math.floor(30 * random()), 1 + Math.floor(30 * random()), 1];
    const count = counts.reduce((sum, each) => sum + each);
    lines.push(`${head},"key":"fleet.distribution.${key}","kind":"distribution","count":${count},"minimum":0.5,` +
      `"maximum":${100 + 50 * random()},"mean":${12 + random()},"squared_deviations":${count * (3 + random())},` +
      `"lower":[null,10,100],"upper":[10,100,null],"counts":[${counts}]}`);
  }
  return lines.join('\n') + '\n';
}

export function generate(directory, devices, days, keys) {
  fs.mkdirSync(directory, { recursive: true });
  const random = randomNumbers(1);
  for (let first = 0; first < devices; first += 500) {
    const file = fs.openSync(path.join(directory, `part-${String(first).padStart(8, '0')}.ndjson`), 'w');
    for (let device = first; device < Math.min(first + 500, devices); ++device) {
      for (let day = 0; day < days; ++day) fs.writeSync(file, logOf(device, day, days, keys, random));
    }
    fs.closeSync(file);
  }
}

if (process.argv[1] === import.meta.filename) {
  const [directory, ...numbers] = process.argv.slice(2);
  generate(directory, ...numbers.map(Number));
}
