// Rows as the server takes them.
import { createHash } from 'node:crypto';

const NEWLINE = 10;
const MEAN = Buffer.from('"mean":');
const BITS = '"mean_bits":';
const number = new Float64Array(1);
const bits = new BigUint64Array(number.buffer);

function bitsOf(value) {
  number[0] = value;
  return bits[0].toString();
}

/** A device as the server names it, in decimal digits; 0 if there is none. */
export function deviceNumber(pseudonym) {
  return pseudonym === null ? '0' : createHash('sha256').update(pseudonym).digest().readBigUInt64LE().toString();
}

/** What every row says of its log. */
function commonMembers({ device, sequence, day, version, configuration }) {
  return { device: deviceNumber(device), sequence, day, version, configuration };
}

/** Where the number ends that begins there: at "," or "}". */
function numberEnd(bytes, begin) {
  let end = begin;
  while (end < bytes.length && bytes[end] !== 44 && bytes[end] !== 125) ++end;
  return end;
}

/** Bytes that grow at their end. */
class Output {
  bytes = Buffer.allocUnsafe(1 << 24);
  filled = 0;

  reserve(more) {
    if (this.filled + more <= this.bytes.length) return;
    const larger = Buffer.allocUnsafe(Math.max(2 * this.bytes.length, this.filled + more));
    this.bytes.copy(larger, 0, 0, this.filled);
    this.bytes = larger;
  }

  copy(bytes, begin, end) {
    this.filled += bytes.copy(this.bytes, this.filled, begin, end);
  }

  write(text) {
    this.filled += this.bytes.latin1Write(text, this.filled);
  }
}

/** Adds a log's rows, with a short header, and with the bits of each mean in place of its digits. */
function addRows(out, { header, headerLength, bytes }) {
  const short = Buffer.from(JSON.stringify(commonMembers(header)).slice(0, -1));
  let mean = bytes.indexOf(MEAN);
  for (let begin = 0, end; begin < bytes.length; begin = end) {
    end = bytes.indexOf(NEWLINE, begin) + 1;
    out.reserve(short.length + end - begin + BITS.length + 20);
    out.copy(short, 0, short.length);
    let copied = begin + headerLength;
    if (mean >= 0 && mean < end) {
      const rest = numberEnd(bytes, mean + MEAN.length);
      const text = bytes.latin1Slice(mean + MEAN.length, rest).trim();
      const value = Number(text);
      // What is no number is left to the server, which skips "mean" or refuses the row.
      if (text !== '' && Number.isFinite(value)) {
        out.copy(bytes, copied, mean);
        out.write(BITS + bitsOf(value));
        copied = rest;
      }
      mean = bytes.indexOf(MEAN, end);
    }
    out.copy(bytes, copied, end);
  }
}

const out = new Output();

/** The rows of logs in one piece, which is valid until the next call. */
export function forServer(logs) {
  out.filled = 0;
  for (const log of logs) {
    if (log.headerLength > 0) {
      addRows(out, log);
      continue;
    }
    const text = Buffer.from(readableRows([log]).rows.map(row => `${JSON.stringify(row)}\n`).join(''));
    out.reserve(text.length);
    out.copy(text, 0, text.length);
  }
  return out.bytes.subarray(0, out.filled);
}

const isNumber = value => typeof value === 'number';
const isBound = value => value === null || isNumber(value);
const isCount = value => Number.isSafeInteger(value) && value >= 0;
const listOf = (value, check) => value === undefined || (Array.isArray(value) && value.every(check));

function isInteger64(value) {
  if (typeof value !== 'string' || !/^-?\d{1,19}$/.test(value)) return false;
  return BigInt.asIntN(64, BigInt(value)) === BigInt(value);
}

function readableRow(line, members) {
  let row;
  try {
    row = JSON.parse(line);
  } catch {
    return undefined;
  }
  const { key, kind, value, count, minimum = null, maximum = null, mean = null, lower, upper, counts } = row;
  const squares = row.squared_deviations ?? null;
  const isText = text => text === null || text.isWellFormed();
  if (typeof key !== 'string' || ![key, members.version, members.configuration].every(isText)) return undefined;
  const common = { ...members, key, kind };
  if (kind === 'scalar') return isInteger64(value) ? { ...common, value } : undefined;
  const valid = kind === 'distribution' && isCount(count) && count < 2 ** 32 && listOf(counts, isCount) &&
    [minimum, maximum, mean, squares].every(isBound) && listOf(lower, isBound) && listOf(upper, isBound);
  if (!valid) return undefined;
  return { ...common, count, minimum, maximum, squared_deviations: squares,
    ...(mean === null ? {} : { mean_bits: bitsOf(mean) }),
    lower: lower ?? [], upper: upper ?? [], counts: counts ?? [] };
}

/** The rows of logs that can be read, and how many cannot. */
export function readableRows(logs) {
  const rows = [];
  let refused = 0;
  for (const { bytes, header } of logs) {
    const common = commonMembers(header);
    for (const line of bytes.toString('utf8').split('\n')) {
      if (line === '') continue;
      const row = readableRow(line, common);
      if (row) rows.push(row); else refused++;
    }
  }
  return { rows, refused };
}
