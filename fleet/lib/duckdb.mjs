// The embedded engine: DuckDB over exported files, or over the Parquet files made from them.
import fs from 'node:fs';
import { createRequire } from 'node:module';
import os from 'node:os';
import path from 'node:path';
import { quoted } from './dialect.mjs';
import { exportedFiles, FleetError, LAST_DAY, readLogs } from './logs.mjs';

const CONVERTED = 'parquet';
const MANIFEST = 'files.json';
const LOG_COLUMNS = 'file, "offset", length, device, sequence, day, version, hash';
const ROW_COLUMNS = {
  device: 'VARCHAR', sequence: 'BIGINT', day: 'INTEGER', system_version: 'VARCHAR', configuration: 'VARCHAR',
  key: 'VARCHAR', kind: 'VARCHAR', value: 'BIGINT', count: 'BIGINT', mean: 'DOUBLE', squared_deviations: 'DOUBLE',
  lower: 'DOUBLE[]', upper: 'DOUBLE[]', counts: 'BIGINT[]',
};

function library() {
  try {
    // As NODE_PATH is honoured too, unlike by import.
    return createRequire(import.meta.url)('@duckdb/node-api');
  } catch (error) {
    throw new FleetError(`DuckDB is not installed (npm install @duckdb/node-api): ${error.message.split('\n')[0]}`);
  }
}

const text = value => quoted(value, 'duckdb');
// The names of files are patterns to DuckDB.
const exactly = file => file.replace(/[[\]*?]/g, '[$&]');

function manifestOf(files) {
  return files.map(file => {
    const { size, mtimeMs } = fs.statSync(file);
    return { name: path.basename(file), size, mtimeMs };
  });
}

/** The manifest of the Parquet files, if there are any. Those that a conversion put aside before it ended come back. */
function manifestIn(directory) {
  const folder = path.join(directory, CONVERTED);
  if (!fs.existsSync(folder) && fs.existsSync(aside(directory))) fs.renameSync(aside(directory), folder);
  try {
    return fs.readFileSync(path.join(folder, MANIFEST), 'utf8');
  } catch {
    return undefined;
  }
}

const aside = directory => path.join(directory, `.${CONVERTED}.former`);

export const hasConverted = directory => manifestIn(directory) !== undefined;

/** Whether the Parquet files hold what there is: what the exported files hold now, or all if there are none. */
function isConverted(directory, files) {
  const manifest = manifestIn(directory);
  if (manifest === undefined) return false;
  if (files.length === 0 || manifest === JSON.stringify(manifestOf(files))) return true;
  const gone = JSON.parse(manifest).find(({ name }) => !fs.existsSync(path.join(directory, name)));
  if (gone) {
    throw new FleetError(`${directory}: ${CONVERTED} holds ${gone.name}, which is gone, and there are new files: ` +
      'put it back, or give new files a directory of their own');
  }
  return false;
}

function replaceFolder(directory, made) {
  for (const name of fs.readdirSync(made)) {
    const descriptor = fs.openSync(path.join(made, name));
    fs.fsyncSync(descriptor);
    fs.closeSync(descriptor);
  }
  const folder = path.join(directory, CONVERTED);
  fs.rmSync(aside(directory), { recursive: true, force: true });
  if (fs.existsSync(folder)) fs.renameSync(folder, aside(directory));
  fs.renameSync(made, folder);
  fs.rmSync(aside(directory), { recursive: true, force: true });
}

export class DuckDb {
  dialect = 'duckdb';
  tables = { rows: 'rows', all_rows: 'rows', logs: 'logs', all_logs: 'logs' };

  /** Opens the directory; `key`, if given, is the only one whose rows are wanted. */
  static async open(directory, key) {
    const engine = new DuckDb();
    await engine.connect();
    try {
      const files = exportedFiles(directory);
      if (isConverted(directory, files)) await engine.useParquet(path.join(directory, CONVERTED));
      else await engine.useExported(directory, files, key);
    } catch (error) {
      engine.close();
      throw error;
    }
    return engine;
  }

  async connect() {
    this.temporary = fs.mkdtempSync(path.join(os.tmpdir(), 'tallyfleet-'));
    const { DuckDBInstance } = library();
    this.instance = await DuckDBInstance.create(path.join(this.temporary, 'work.duckdb'));
    this.connection = await this.instance.connect();
    // Files of others are read: nothing of them may be code, or reach further.
    await this.run(`SET temp_directory = ${text(this.temporary)}; SET autoinstall_known_extensions = false;
      SET autoload_known_extensions = false`);
  }

  async run(sql) {
    await this.connection.run(sql);
  }

  /** The rows of an answer as arrays; integers become numbers. */
  async query(sql) {
    const reader = await this.connection.runAndReadAll(sql);
    return reader.getRowsJS().map(row => row.map(plain));
  }

  close() {
    this.connection?.closeSync();
    this.instance?.closeSync();
    fs.rmSync(this.temporary, { recursive: true, force: true });
  }

  async useParquet(folder) {
    await this.run(`CREATE VIEW logs AS FROM read_parquet(${text(`${exactly(folder)}/logs.parquet`)});
      CREATE VIEW rows AS FROM read_parquet(${text(`${exactly(folder)}/rows-*.parquet`)})`);
  }

  async useExported(directory, files, key) {
    if (files.length === 0) throw new FleetError(`${directory}: no exported files (*.ndjson)`);
    await this.findLogs(files);
    const cleaned = await this.withoutRefused(files);
    const columns = Object.entries(ROW_COLUMNS).map(([name, type]) => `"${name}": '${type}'`).join(', ');
    await this.run(`CREATE TABLE rows AS SELECT *, coalesce(system_version, '') AS version
      FROM read_ndjson([${text(cleaned.map(exactly))}], columns = {${columns}}, ignore_errors = true)
      WHERE device IS NOT NULL AND sequence IS NOT NULL AND day BETWEEN 0 AND ${LAST_DAY}
        AND (kind = 'scalar' AND value IS NOT NULL OR kind = 'distribution' AND "count" BETWEEN 0 AND 4294967295)
        AND ${key === undefined ? 'key IS NOT NULL' : `key = ${text(key)}`}`);
  }

  /** Lists every log of the files, and decides which of those with one identity is kept: the first. */
  async findLogs(files) {
    await this.run(`CREATE TABLE found (file INTEGER, "offset" BIGINT, length BIGINT, device VARCHAR,
      sequence BIGINT, day INTEGER, version VARCHAR, hash VARCHAR)`);
    const appender = await this.connection.createAppender('found');
    for (const [number, file] of files.entries()) {
      for (const log of readLogs(file)) appendLog(appender, number, log);
    }
    appender.closeSync();
    await this.run(`CREATE TABLE logs AS SELECT ${LOG_COLUMNS}, CASE
        WHEN hash IS NULL THEN 'unreadable'
        WHEN row_number() OVER identical > 1 THEN 'duplicate'
        WHEN row_number() OVER same > 1 THEN 'conflict'
        WHEN sequence IS NULL THEN 'bare' WHEN day IS NULL THEN 'undated' ELSE 'kept' END AS state
      FROM found WINDOW
        identical AS (PARTITION BY device, sequence, hash ORDER BY file, "offset"),
        same AS (PARTITION BY device, sequence, CASE WHEN sequence IS NULL THEN hash END ORDER BY file, "offset");
      DROP TABLE found`);
  }

  /** The files, with copies in place of those that hold something refused. */
  async withoutRefused(files) {
    const refused = await this.query(`SELECT file, "offset", length FROM logs
      WHERE state IN ('unreadable', 'duplicate', 'conflict') ORDER BY file, "offset"`);
    const ofFile = groupBy(refused);
    return files.map((file, number) => {
      if (!ofFile.has(number)) return file;
      const copy = path.join(this.temporary, `${number}.ndjson`);
      copyWithout(file, copy, ofFile.get(number));
      return copy;
    });
  }

  /**
   * Writes the Parquet files beside the exported ones, from which they are made, or from the Parquet files if
   * there are no others: sorted by key, day and device, one for a month. Without a device's data, if given.
   */
  static async convert(directory, without = '') {
    const files = exportedFiles(directory);
    const manifest = JSON.stringify(manifestOf(files));
    const converted = isConverted(directory, files);
    const engine = new DuckDb();
    const folder = path.join(directory, CONVERTED);
    const made = path.join(directory, `.${CONVERTED}-${process.pid}`);
    removeUnfinished(directory);
    await engine.connect();
    try {
      if (files.length === 0 && converted) await engine.useParquet(folder);
      else await engine.useExported(directory, files);
      fs.mkdirSync(made);
      await engine.run(`COPY (FROM logs WHERE device IS DISTINCT FROM ${text(without)} ORDER BY day, device)
        TO ${text(path.join(made, 'logs.parquet'))} (FORMAT parquet, COMPRESSION zstd)`);
      const months = await engine.query(
        `SELECT DISTINCT strftime(DATE '1970-01-01' + day, '%Y-%m') AS month FROM rows ORDER BY month`);
      for (const [month] of months.length ? months : [['none']]) {
        await engine.run(`COPY (FROM rows WHERE strftime(DATE '1970-01-01' + day, '%Y-%m') = ${text(month)}
          AND device <> ${text(without)} ORDER BY key, day, device) TO ${text(path.join(made, `rows-${month}.parquet`))}
          (FORMAT parquet, COMPRESSION zstd, ROW_GROUP_SIZE 61440)`);
      }
      fs.writeFileSync(path.join(made, MANIFEST), manifest);
      replaceFolder(directory, made);
    } finally {
      engine.close();
      fs.rmSync(made, { recursive: true, force: true });
    }
    return folder;
  }
}

/** What conversions that were killed have left: it may hold a device that was asked to be forgotten. */
function removeUnfinished(directory) {
  for (const name of fs.readdirSync(directory)) {
    const number = new RegExp(`^\\.${CONVERTED}-(\\d+)$`).exec(name)?.[1];
    if (number && !isRunning(Number(number))) fs.rmSync(path.join(directory, name), { recursive: true, force: true });
  }
}

function isRunning(number) {
  try {
    process.kill(number, 0);
    return true;
  } catch (error) {
    return error.code !== 'ESRCH';
  }
}

function plain(value) {
  if (typeof value === 'bigint') return Number(value);
  return Array.isArray(value) ? value.map(plain) : value;
}

function groupBy(rows) {
  const groups = new Map();
  for (const row of rows) {
    if (!groups.has(row[0])) groups.set(row[0], []);
    groups.get(row[0]).push(row);
  }
  return groups;
}

function appendLog(appender, file, log) {
  const { device = null, sequence = null, day = null, version = null } = log.header ?? {};
  appender.appendInteger(file);
  appender.appendBigInt(BigInt(log.offset));
  appender.appendBigInt(BigInt(log.length));
  if (device === null) appender.appendNull(); else appender.appendVarchar(device);
  if (sequence === null) appender.appendNull(); else appender.appendBigInt(BigInt(sequence));
  if (day === null) appender.appendNull(); else appender.appendInteger(day);
  if (version === null) appender.appendNull(); else appender.appendVarchar(version);
  if (log.refused) appender.appendNull(); else appender.appendVarchar(log.hash);
  appender.endRow();
}

/** Copies a file without some ranges of it. */
function copyWithout(file, copy, ranges) {
  const from = fs.openSync(file, 'r');
  const to = fs.openSync(copy, 'wx', 0o600);
  const buffer = Buffer.allocUnsafe(1 << 20);
  const copyRange = (begin, end) => {
    for (let got; begin < end; begin += got) {
      got = fs.readSync(from, buffer, 0, Math.min(buffer.length, end - begin), begin);
      if (got === 0) return;
      fs.writeSync(to, buffer, 0, got);
    }
  };
  try {
    let at = 0;
    for (const [, offset, length] of ranges) {
      copyRange(at, offset);
      at = offset + length;
    }
    copyRange(at, fs.fstatSync(from).size);
  } finally {
    fs.closeSync(from);
    fs.closeSync(to);
  }
}
