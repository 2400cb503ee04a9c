// Loads exported files into ClickHouse, batch by batch: rows, then which logs they were, then how far the
// file is done. After a crash at any point the same batch is sent again, and makes no difference.
import { createHash } from 'node:crypto';
import fs from 'node:fs';
import path from 'node:path';
import { setImmediate as turn } from 'node:timers/promises';
import { quoted } from './dialect.mjs';
import { dateOf, exportedFiles, FleetError, readLogs } from './logs.mjs';
import { deviceNumber, forServer, readableRows } from './rows.mjs';

const BATCH_BYTES = 64 << 20;
const BATCH_LOGS = 5000;
const BATCH_MONTHS = 60; // the server writes a part for each, and refuses too many
const MARK = 4096; // bytes by which a place in a file is known again

const md5 = bytes => createHash('md5').update(bytes).digest('hex');
const lines = objects => [Buffer.from(objects.map(each => JSON.stringify(each)).join('\n') + '\n')];
const text = value => quoted(value, 'clickhouse');

function bytesAt(descriptor, begin, length) {
  const bytes = Buffer.alloc(length);
  return bytes.subarray(0, fs.readSync(descriptor, bytes, 0, length, begin));
}

/** How a file is known again: by its name and first line, and the bytes before a place. */
class LoadedFile {
  constructor(file) {
    this.file = file;
    this.name = path.basename(file);
    const descriptor = fs.openSync(file, 'r');
    const head = bytesAt(descriptor, 0, 1 << 16);
    fs.closeSync(descriptor);
    this.size = fs.statSync(file).size;
    this.first = md5(head.subarray(0, head.indexOf(10) + 1));
  }

  mark(offset) {
    const descriptor = fs.openSync(this.file, 'r');
    const begin = Math.max(0, offset - MARK);
    const mark = md5(bytesAt(descriptor, begin, offset - begin));
    fs.closeSync(descriptor);
    return mark;
  }

  source(offset) {
    return md5(`${this.name}:${this.first}:${offset}`).slice(0, 16);
  }

  async done(server) {
    const rows = await server.query(`SELECT done, last FROM ${server.names.files}
      WHERE name = ${text(this.name)} AND first = ${text(this.first)} ORDER BY done DESC LIMIT 1`);
    const [done, last] = rows[0] ?? [0, ''];
    return done > 0 && done <= this.size && this.mark(done) === last ? done : 0;
  }
}

class Batch {
  logs = [];
  bytes = 0;
  months = new Set();

  add(log, source) {
    this.logs.push({ ...log, source });
    this.bytes += log.length;
    if (Number.isInteger(log.header?.day)) this.months.add(dateOf(log.header.day).slice(0, 7));
    this.end = log.offset + log.length;
  }

  get full() {
    return this.bytes >= BATCH_BYTES || this.logs.length >= BATCH_LOGS || this.months.size >= BATCH_MONTHS;
  }
}

const identityOf = ({ header, hash }) => (header.sequence === null ? hash : `${deviceNumber(header.device)} ${header.sequence}`);

const devicesOf = logs => [...new Set(logs.map(({ header }) => deviceNumber(header.device)))].join(', ');

/** What the server knows of the batch's identities: the hash of the log that was kept, and from where. */
async function knownLogs(server, batch) {
  const readable = batch.logs.filter(log => !log.refused);
  const named = readable.filter(({ header }) => header.sequence !== null);
  const known = new Map();
  const take = ([device, sequence, hash, source]) =>
    known.set(sequence === 0 ? hash : `${device} ${sequence}`, { hash, source });
  const ask = async condition => (await server.query(`SELECT toString(device), sequence, hash, source
    FROM ${server.names.logs} WHERE state IN ('kept', 'undated', 'bare') AND ${condition}`)).forEach(take);
  if (named.length > 0) {
    const sequences = named.map(({ header }) => header.sequence);
    await ask(`device IN (${devicesOf(named)})
      AND sequence BETWEEN ${Math.min(...sequences)} AND ${Math.max(...sequences)}`);
  }
  const bare = readable.filter(({ header }) => header.sequence === null);
  if (bare.length > 0) {
    await ask(`device IN (${devicesOf(bare)}) AND sequence = 0 AND hash IN (${text(bare.map(({ hash }) => hash))})`);
  }
  return known;
}

/** Gives each log its state. The first log of an identity is the one that counts. */
function classify(batch, known) {
  for (const log of batch.logs) {
    if (log.refused) {
      log.state = 'unreadable';
      continue;
    }
    const identity = identityOf(log);
    const former = known.get(identity);
    if (former && former.source !== log.source) log.state = former.hash === log.hash ? 'duplicate' : 'conflict';
    else log.state = log.header.sequence === null ? 'bare' : log.header.day === null ? 'undated' : 'kept';
    // Rows are sent before their log is listed: one that is listed from this place has all of them.
    log.isNew = log.state === 'kept' && !former;
    if (!former) known.set(identity, log);
  }
}

function ledgerRow({ header, hash, source, state }) {
  const { device = null, sequence, day = null, version } = header ?? {};
  return { device: deviceNumber(device), sequence: sequence ?? 0, day, date: dateOf(day ?? 0), version: version ?? '',
    hash: hash ?? '', source, state };
}

async function insertRows(server, logs, counts) {
  if (logs.length === 0) return;
  try {
    await server.insert('rows', '', [forServer(logs)]);
  } catch (error) {
    if (error.status === undefined) throw error;
    // A row that the server cannot read takes the batch with it: send those that can be read.
    const { rows, refused } = readableRows(logs);
    counts.unreadable += refused;
    if (rows.length > 0) await server.insert('rows', '', lines(rows));
  }
}

async function flush(server, file, batch, counts) {
  classify(batch, await knownLogs(server, batch));
  await insertRows(server, batch.logs.filter(log => log.isNew), counts);
  await server.insert('logs', '', lines(batch.logs.map(ledgerRow)));
  await server.insert('files', '', lines([{ name: file.name, first: file.first, done: batch.end, last: file.mark(batch.end) }]));
  for (const { state, isNew } of batch.logs) {
    if (state !== 'kept') counts[state]++;
    else counts[isNew ? 'loaded' : 'resumed']++;
  }
}

async function loadFile(server, file, counts) {
  let batch = new Batch();
  let sending = Promise.resolve(); // the batch before, meanwhile
  const send = async () => {
    await sending;
    sending = flush(server, file, batch, counts);
    sending.catch(() => {}); // is thrown where it is awaited
    batch = new Batch();
  };
  for (const log of readLogs(file.file, await file.done(server))) {
    if (log.partial) break;
    batch.add(log, file.source(log.offset));
    if (batch.full) await send();
    else if (batch.logs.length % 100 === 0) await turn();
  }
  if (batch.logs.length > 0) await send();
  await sending;
}

/** Loads the exported files of a directory that are not loaded yet; returns the logs by what became of them. */
export async function load(server, directory) {
  const counts = { loaded: 0, resumed: 0, duplicate: 0, conflict: 0, bare: 0, undated: 0, unreadable: 0 };
  try {
    const files = exportedFiles(directory);
    if (files.length === 0) throw new FleetError(`${directory}: no exported files (*.ndjson)`);
    for (const file of files) await loadFile(server, new LoadedFile(file), counts);
  } finally {
    server.close();
  }
  return counts;
}
