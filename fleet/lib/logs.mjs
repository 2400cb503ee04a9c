// Finds the logs in exported rows. A log is a run of adjacent lines with the same header, which is
// everything before the member "key". Lines are compared as bytes and only headers are parsed, so that
// reading is limited by the disk or by the engine, not by this program.
import { createHash } from 'node:crypto';
import fs from 'node:fs';
import path from 'node:path';

const CHUNK = 4 << 20;
const LONGEST_LOG = 512 << 20;
const NEWLINE = 10;
const KEY = Buffer.from(',"key":"');
const KIND = Buffer.from(',"kind":"');
export const LAST_DAY = 49709; // engines keep dates to 2106-02-06
// A sequence number and a day fit into one 64-bit integer, which the questions sort by.
const LAST_SEQUENCE = 2 ** 45;

export class FleetError extends Error {}

export const dateOf = day => new Date(day * 86400000).toISOString().slice(0, 10);

/** The files with exported rows in a directory, in the order in which logs count as first. */
export function exportedFiles(directory) {
  let names;
  try {
    names = fs.readdirSync(directory);
  } catch (error) {
    throw new FleetError(`${directory}: ${error.code === 'ENOENT' ? 'no such directory' : error.message}`);
  }
  return names.filter(name => name.endsWith('.ndjson')).sort().map(name => path.join(directory, name));
}

const isDay = day => day !== null && day >= 0 && day <= LAST_DAY;

const isText = value => typeof value === 'string' && value.length <= 1024;
const textOrNull = value => value === null || value === undefined || (isText(value) && value.isWellFormed());

/** Whether a text can name a device: a pseudonym, or what whoever exported the log calls it. */
export const isDevice = value => isText(value) && value !== '' && !value.includes('\0') && value.isWellFormed();

/** The date belongs to the day; that of a day out of range is not looked at. */
function agree(date, day) {
  return date === null || (isDay(day) ? date === dateOf(day) : day !== null && isText(date));
}

/** The header of a log, or undefined if it is not one that this version can read. */
function headerOf(row) {
  const { schema, device = null, sequence = null, day = null, date = null } = row;
  const valid = schema === 1 && (device === null || isDevice(device)) &&
    (sequence === null || (Number.isSafeInteger(sequence) && sequence > 0 && sequence < LAST_SEQUENCE)) &&
    (day === null || Number.isSafeInteger(day)) && agree(date, day) &&
    textOrNull(row.system_version) && textOrNull(row.configuration);
  if (!valid) return undefined;
  // A number without a device says nothing. A device without a number is kept, so that it can be forgotten.
  return { device, sequence: device === null ? null : sequence, day: isDay(day) ? day : null,
    version: row.system_version ?? '', configuration: row.configuration ?? '' };
}

function parsed(text) {
  try {
    const value = JSON.parse(text);
    return typeof value === 'object' && value !== null ? value : undefined;
  } catch {
    return undefined;
  }
}

/** What a line says about its log: the length of its header, or 0 if its members come in another order. */
function lineHeader(bytes, begin, end) {
  const at = bytes.indexOf(KEY, begin);
  if (at > begin && at < end) {
    const row = parsed(bytes.toString('utf8', begin, at) + '}');
    if (row) {
      const kind = bytes.indexOf(KIND, at);
      const hasKind = kind > 0 && kind < end;
      return { length: at - begin, row, label: hasKind ? bytes.toString('latin1', at, kind + KIND.length + 1) : '' };
    }
  }
  const row = parsed(bytes.toString('utf8', begin, end));
  return row && typeof row.key === 'string' ? { length: 0, row, label: `${row.kind} ${row.key}` } : undefined;
}

/** Collects lines until the log ends. */
class Run {
  constructor(bytes, begin, end, first, header) {
    this.begin = begin;
    this.end = end;
    this.rows = 1;
    this.header = header;
    this.first = first;
    // A log never repeats a row: its first one again is the start of another log with the same header.
    this.prefix = Buffer.from(bytes.subarray(begin, begin + first.length + KEY.length));
    this.label = Buffer.from(first.label, 'latin1');
    this.lastOfKey = this.label.length - KIND.length - 3; // before its quote and the kind
  }

  takes(bytes, begin, end) {
    const { length } = this.first;
    if (length === 0) return this.takesParsed(bytes, begin, end);
    const rest = begin + this.prefix.length;
    if (rest >= end || this.prefix.compare(bytes, begin, rest) !== 0) return false;
    const label = begin + length;
    // One byte tells most keys apart, at less cost than a call.
    return bytes[label + this.lastOfKey] !== this.label[this.lastOfKey] || label + this.label.length > end ||
      this.label.compare(bytes, label, label + this.label.length) !== 0;
  }

  takesParsed(bytes, begin, end) {
    const line = lineHeader(bytes, begin, end);
    if (!line || line.length > 0 || line.label === this.first.label) return false;
    const header = headerOf(line.row);
    return header !== undefined && JSON.stringify(header) === JSON.stringify(this.header);
  }
}

/**
 * Yields the logs of a file from an offset on, and what is none:
 * { header, headerLength, bytes, hash, offset, length, rows }, where each line repeats the header in its
 * first `headerLength` bytes, or anywhere if that is 0; or { refused: true, offset, length } for a line that
 * cannot be read; `partial` if it is the last one and lacks its end, since whoever writes it may not be
 * done.
 */
export function* readLogs(file, offset = 0) {
  const descriptor = fs.openSync(file, 'r');
  try {
    let bytes = Buffer.allocUnsafe(CHUNK);
    let filled = 0; // of the buffer
    let base = offset; // the place in the file of the buffer's first byte
    let run;
    for (;;) {
      const got = fs.readSync(descriptor, bytes, filled, bytes.length - filled, base + filled);
      filled += got;
      let begin = run ? run.end : 0;
      for (let end; (end = bytes.indexOf(NEWLINE, begin)) >= 0 && end < filled; begin = end + 1) {
        if (run?.takes(bytes, begin, end)) {
          run.end = end + 1;
          run.rows++;
          continue;
        }
        if (run) yield finished(run, bytes, base);
        run = undefined;
        const line = lineHeader(bytes, begin, end);
        const header = line && headerOf(line.row);
        if (header) run = new Run(bytes, begin, end + 1, line, header);
        else yield { refused: true, offset: base + begin, length: end + 1 - begin };
        if (run) run.end = end + 1;
      }
      if (got === 0) {
        if (run) yield finished(run, bytes, base);
        const rest = { offset: base + begin, length: filled - begin };
        if (rest.length > 0) yield { refused: true, partial: true, ...rest };
        return;
      }
      const keep = run ? run.begin : begin;
      bytes = withSpace(bytes, keep, filled, file);
      filled -= keep;
      base += keep;
      if (run) {
        run.end -= keep;
        run.begin = 0;
      }
    }
  } finally {
    fs.closeSync(descriptor);
  }
}

function withSpace(bytes, keep, filled, file) {
  const kept = filled - keep;
  if (kept > LONGEST_LOG) throw new FleetError(`${file}: a log of more than ${LONGEST_LOG} bytes`);
  // A new one each time: logs that were yielded keep theirs, without a copy.
  const target = Buffer.allocUnsafe(Math.max(CHUNK, kept * 2));
  bytes.copy(target, 0, keep, filled);
  return target;
}

function finished(run, bytes, base) {
  const log = bytes.subarray(run.begin, run.end);
  const hash = createHash('sha256').update(log).digest('hex').slice(0, 32);
  return { header: run.header, headerLength: run.first.length, bytes: log, hash,
    offset: base + run.begin, length: log.length, rows: run.rows };
}
