// What may be told of K devices and no fewer. Every answer of every question, from either engine, goes
// through here; docs/fleet.md explains the rules and what they cannot do.

export class Anonymity {
  constructor(k) {
    this.k = k;
    this.withheld = 0; // of the answer, in rows
  }

  /** A number of devices: the nearest multiple of K, so that no two numbers differ by fewer than K. */
  devices(number) {
    return number < this.k ? null : Math.round(number / this.k) * this.k;
  }

  /** What concerns that many devices. None is not told apart from too few. */
  value(number, value) {
    return number < this.k ? null : value;
  }

  /** A count of what devices did, in steps of what K of them did, and of K at least. */
  count(number, count) {
    return this.value(number, coarse(count, Math.max(1, count / number) * this.k));
  }

  /** A sum of what devices did, in steps of what K average ones do: { told, size }; nothing if one device does more. */
  sum(number, sum, largest) {
    const size = sum / number * this.k;
    return number < this.k || largest > size ? undefined : { told: coarse(sum, size), size };
  }

  /**
   * A mean or another figure of which one device may move `moved`, and its standard error: in steps of the
   * larger one of that error and of so many times `moved` that one device does not show.
   */
  figure(value, moved, error, round) {
    return coarse(value, Math.max(error, Math.sqrt(this.k) * moved), round);
  }

  /** The share of some of the devices, from rounded numbers, if those and the others are enough. */
  share(some, all) {
    return some < this.k || all - some < this.k ? null : this.devices(some) / this.devices(all);
  }

  /** A bound of a share in steps of K devices; `towards` is Math.floor or Math.ceil. */
  bound(value, all, towards) {
    const step = this.k / this.devices(all);
    return towards(value / step) * step;
  }

  /** Whether those left out of some devices may be found by subtraction: they are none, or enough. */
  separable(all, some) {
    return all === some || all - some >= this.k;
  }

  /**
   * The value of rank ceil(level * number), with K devices on each side of it, itself included. It is one
   * device's, so that it is rounded to about its standard error: `spread` is the distance of the quartiles, and
   * a quantile far from the median is as uncertain as it is far.
   */
  quantile(number, level, value, spread, median) {
    const rank = Math.ceil(level * number);
    const uncertain = Math.max(spread, Math.abs(value - median)) / Math.sqrt(number);
    return rank < this.k || number - rank + 1 < this.k ? null : coarse(value, uncertain);
  }

  /** The level nearest to the one wanted, towards the median, whose quantile may be told. */
  supportedLevel(number, level) {
    const least = this.k / number;
    return least > 0.5 ? undefined : Math.min(Math.max(level, least), 1 - least);
  }

  /**
   * The rows of groups that are large enough. The groups of one partition have a sum that may be known:
   * if those left out are together fewer than K devices, the smallest of the others is left out too.
   */
  release(rows, devicesOf, partitionOf = () => '') {
    const partitions = new Map();
    for (const row of rows) {
      const name = partitionOf(row);
      if (!partitions.has(name)) partitions.set(name, []);
      partitions.get(name).push(row);
    }
    const released = new Set();
    for (const members of partitions.values()) {
      members.sort((one, other) => devicesOf(one) - devicesOf(other));
      let hidden = 0;
      let first = 0;
      while (first < members.length && (devicesOf(members[first]) < this.k || (hidden > 0 && hidden < this.k))) {
        hidden += devicesOf(members[first++]);
      }
      this.withheld += first;
      members.slice(first).forEach(row => released.add(row));
    }
    return rows.filter(row => released.has(row));
  }

  /** Neighbouring buckets { from, to, devices }, each device in one of them, put together until each has K devices. */
  joined(buckets) {
    const told = [];
    let open;
    for (const bucket of buckets) {
      open = open ? { ...open, to: bucket.to, devices: open.devices + bucket.devices } : bucket;
      if (open.devices < this.k) continue;
      told.push(open);
      open = undefined;
    }
    const last = told.at(-1);
    if (open && last) Object.assign(last, { to: open.to, devices: last.devices + open.devices });
    return told;
  }

  /**
   * One set of bounds for the histograms of several groups, in each bucket of which each group has K devices
   * or none, so that subtracting groups finds no fewer. Cells { from, to, devices, parts } are buckets as
   * reported, with what each group has there: { devices, samples }. A device may be in all cells, so that
   * some cells have no more devices for sure than the largest has. Returns [{ from, to, samples }], with the
   * samples of each group; nothing if there are no such bounds.
   */
  commonBuckets(cells) {
    const told = [];
    let open;
    for (const cell of blocksOf(cells, this.k)) {
      open = open ? united(open, cell) : cell;
      if (!open.sure || !this.suffices(open)) continue;
      told.push(open);
      open = undefined;
    }
    if (open) told.push(open);
    while (told.length > 1 && !this.suffices(told.at(-1))) told.push(united(...told.splice(-2)));
    if (told.length === 0 || !this.suffices(told.at(-1))) return [];
    // Bounds that only few devices report are not told, nor where the samples of few begin and end.
    const from = told[0].fromSure ? told[0].from : null;
    return told.map(({ to, sure, parts }, index) =>
      ({ from: index > 0 ? told[index - 1].to : from, to: sure ? to : null, samples: parts.map(({ samples }) => samples) }));
  }

  suffices({ parts }) {
    return parts.every(({ devices, samples }) => samples === 0 || devices >= this.k);
  }
}

const below = ({ from }) => from ?? -Infinity;
const above = ({ to }) => to ?? Infinity;

function united(one, other) {
  const last = above(one) > above(other) ? one : other;
  return { from: one.from, to: last.to, fromSure: one.fromSure,
    sure: above(one) === above(other) ? one.sure || other.sure : last.sure,
    parts: one.parts.map((part, index) => ({ samples: part.samples + other.parts[index].samples,
      devices: Math.max(part.devices, other.parts[index].devices) })) };
}

const overlap = (one, other) => below(one) < above(other) && below(other) < above(one);

/**
 * Cells in order, those that overlap made one; a bound is sure if K devices report it. A cell of few devices
 * that lies across others is left out, since one device with settings of its own would join all buckets.
 */
function blocksOf(cells, k) {
  const blocks = [];
  const common = cells.filter(({ devices }) => devices >= k);
  const used = cells.filter(cell => cell.devices >= k || !common.some(other => overlap(cell, other)));
  for (const cell of used.toSorted((one, other) => below(one) - below(other) || above(one) - above(other))) {
    const block = { ...cell, fromSure: cell.devices >= k, sure: cell.devices >= k };
    const last = blocks.at(-1);
    if (!last || below(cell) >= above(last)) {
      blocks.push(block);
      continue;
    }
    if (below(cell) === below(last)) last.fromSure ||= block.fromSure;
    blocks[blocks.length - 1] = united(last, block);
  }
  return blocks;
}

/**
 * The least of 1, 2 and 5 times a power of ten that is not below a size: { digit, exponent }. It takes in a
 * little more, since engines add up in different orders.
 */
function stepOf(size) {
  let exponent = Math.floor(Math.log10(size));
  const digit = [1, 2, 5].find(each => each * 10 ** exponent >= size * (1 - 1e-9));
  if (digit === undefined) ++exponent;
  return { digit: digit ?? 1, exponent };
}

/**
 * A value as a multiple of a step not below `size`. Where that is 0, as no device moves the value, it is told
 * as it is.
 */
export function coarse(value, size, round = nearest) {
  if (!Number.isFinite(size)) return null;
  if (!(size > Math.abs(value) * 1e-14) || !Number.isFinite(value)) return value;
  const { digit, exponent } = stepOf(size);
  return Number(`${round(value / Number(`${digit}e${exponent}`)) * digit}e${exponent}`) || 0;
}

// Half a step is rounded up also if an engine has added up to a bit less.
const nearest = value => Math.floor(value + 0.5 + 1e-9);
/** For ends of intervals, which are never told narrower than they are. */
export const down = value => Math.floor(value + 1e-9);
export const up = value => Math.ceil(value - 1e-9);
