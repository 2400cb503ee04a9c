// Rows as the server takes them.

const MEAN = Buffer.from('"mean":');
const BITS = '"mean_bits":';
const number = new Float64Array(1);
const bits = new BigUint64Array(number.buffer);

function bitsOf(value) {
  number[0] = value;
  return bits[0].toString();
}

/** Where the number ends that begins there: at "," or "}". */
function numberEnd(bytes, begin) {
  let end = begin;
  while (end < bytes.length && bytes[end] !== 44 && bytes[end] !== 125) ++end;
  return end;
}

/** The rows of logs in one piece, with the bits of each mean in place of its digits. */
export function forServer(logs) {
  const sum = logs.reduce((total, { bytes }) => total + bytes.length, 0);
  // A mean's bits are longer than its digits, but a row with a mean is longer than both.
  const out = Buffer.allocUnsafe(2 * sum);
  let filled = 0;
  for (const { bytes } of logs) {
    let copied = 0;
    for (let at; (at = bytes.indexOf(MEAN, copied)) >= 0;) {
      const end = numberEnd(bytes, at + MEAN.length);
      const text = bytes.latin1Slice(at + MEAN.length, end).trim();
      const value = Number(text);
      if (text !== '' && Number.isFinite(value)) {
        filled += bytes.copy(out, filled, copied, at);
        filled += out.latin1Write(BITS + bitsOf(value), filled);
      } else {
        // What is no number is left to the server, which skips "mean" or refuses the row.
        filled += bytes.copy(out, filled, copied, end);
      }
      copied = end;
    }
    filled += bytes.copy(out, filled, copied);
  }
  return out.subarray(0, filled);
}

const isNumber = value => typeof value === 'number';
const isBound = value => value === null || isNumber(value);
const isCount = value => Number.isSafeInteger(value) && value >= 0;
const listOf = (value, check) => value === undefined || (Array.isArray(value) && value.every(check));

function isInteger64(value) {
  if (typeof value !== 'string' || !/^-?\d{1,19}$/.test(value)) return false;
  return BigInt.asIntN(64, BigInt(value)) === BigInt(value);
}

function readableRow(line, header) {
  let row;
  try {
    row = JSON.parse(line);
  } catch {
    return undefined;
  }
  const { key, kind, value, count, minimum = null, maximum = null, mean = null, lower, upper, counts } = row;
  const squares = row.squared_deviations ?? null;
  if (typeof key !== 'string') return undefined;
  const common = { device: header.device, sequence: header.sequence, day: header.day, date: row.date,
    system_version: row.system_version ?? null, configuration: row.configuration ?? null, key, kind };
  if (kind === 'scalar') return isInteger64(value) ? { ...common, value } : undefined;
  const valid = kind === 'distribution' && isCount(count) && count < 2 ** 32 && listOf(counts, isCount) &&
    [minimum, maximum, mean, squares].every(isBound) && listOf(lower, isBound) && listOf(upper, isBound);
  if (!valid) return undefined;
  return { ...common, count, minimum, maximum, squared_deviations: squares, ...(mean === null ? {} : { mean_bits: bitsOf(mean) }),
    lower: lower ?? [], upper: upper ?? [], counts: counts ?? [] };
}

/** The rows of logs that can be read, and how many cannot. */
export function readableRows(logs) {
  const rows = [];
  let refused = 0;
  for (const { bytes, header } of logs) {
    for (const line of bytes.toString('utf8').split('\n')) {
      if (line === '') continue;
      const row = readableRow(line, header);
      if (row) rows.push(row); else refused++;
    }
  }
  return { rows, refused };
}
