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

  /** A count of what devices did, rounded as their number is. */
  count(number, count) {
    return this.value(number, Math.round(count / this.k) * this.k);
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

  /** The value of rank ceil(level * number), with K devices on each side of it, itself included. */
  quantile(number, level, value) {
    const rank = Math.ceil(level * number);
    return rank < this.k || number - rank + 1 < this.k ? null : value;
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

  /**
   * Neighbouring buckets { from, to, devices, samples } put together until each has K devices. A device is
   * in one of them if they are `disjoint`; otherwise it may be in all of them, and they have no more
   * devices together than the largest has.
   */
  buckets(buckets, disjoint) {
    const joined = (one, other) => ({
      from: one.from, to: other.to, samples: one.samples + other.samples,
      devices: disjoint ? one.devices + other.devices : Math.max(one.devices, other.devices),
    });
    const merged = [];
    let open;
    for (const bucket of buckets) {
      open = open ? joined(open, bucket) : { ...bucket };
      if (open.devices >= this.k) {
        merged.push(open);
        open = undefined;
      }
    }
    if (open && merged.length > 0) merged.push(joined(merged.pop(), open));
    return merged;
  }
}
