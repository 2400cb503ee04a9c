// The engine for more than one machine: ClickHouse, through its HTTP interface.
import fs from 'node:fs';
import http from 'node:http';
import { FleetError } from './logs.mjs';
import { deviceNumber } from './rows.mjs';

const SETTINGS = {
  output_format_json_quote_64bit_integers: 0,
  output_format_json_quote_denormals: 0,
  input_format_skip_unknown_fields: 1,
  insert_distributed_sync: 1, // a batch is done when every shard has its part
  max_query_size: 16 << 20,
  max_ast_elements: 1000000,
  // A batch is one block, which the server writes whole or not at all.
  max_insert_block_size: 10000000,
};
const LONGEST_STANDSTILL = 600000; // milliseconds in which a deletion gets no further
const TABLES = ['rows', 'logs', 'files'];

/** The statements of a file, without its comments. */
function statementsOf(name, cluster) {
  return fs.readFileSync(new URL(`../clickhouse/${name}.sql`, import.meta.url), 'utf8')
    .replace(/^--.*\n/gm, '').replaceAll('{cluster}', cluster).split(/;\n/).filter(each => each.trim());
}

export class ClickHouse {
  dialect = 'clickhouse';

  constructor(host, port) {
    this.host = host.replace(/[[\]]/g, '');
    this.port = port;
    this.agent = new http.Agent({ keepAlive: true, maxSockets: 1 });
  }

  /** Finds the tables: those of the whole cluster if there are any. */
  async open() {
    const found = (await this.query("SELECT name FROM system.tables WHERE database = 'tally'")).map(row => row[0]);
    this.sharded = TABLES.every(name => found.includes(`${name}_all`));
    const missing = TABLES.filter(name => !found.includes(name));
    if (missing.length > 0) throw new FleetError(`${this.host}:${this.port} has no table tally.${missing[0]}; run schema first`);
    const name = table => `tally.${table}${this.sharded ? '_all' : ''}`;
    this.names = Object.fromEntries(TABLES.map(table => [table, name(table)]));
    // FINAL drops repeated rows before the server has merged them; without it where they make no difference.
    this.tables = { rows: `${name('rows')} FINAL`, logs: `${name('logs')} FINAL`,
      all_rows: name('rows'), all_logs: name('logs') };
    return this;
  }

  /** Creates what is missing; with a cluster of the server's configuration, its tables over all shards too. */
  async createSchema(cluster) {
    if (cluster !== undefined && !/^\w+$/.test(cluster)) throw new FleetError(`not the name of a cluster: ${cluster}`);
    const files = cluster === undefined ? ['schema'] : ['schema', 'sharding'];
    await this.run('CREATE DATABASE IF NOT EXISTS tally');
    for (const each of files.flatMap(file => statementsOf(file, cluster))) await this.run(each);
  }

  /** The rows of an answer as arrays. */
  async query(sql) {
    return JSON.parse(await this.send({}, `${sql}\nFORMAT JSONCompact`)).data;
  }

  async run(sql) {
    await this.send({}, sql);
  }

  /** Inserts NDJSON; `body` is a list of buffers. */
  async insert(table, columns, body) {
    const query = `INSERT INTO ${this.names[table]}${columns ? ` (${columns})` : ''} FORMAT JSONEachRow`;
    await this.send({ query }, ...body);
  }

  /** Deletes all of a device on this server; on a cluster, ask each of its servers. */
  async forget(device) {
    const number = deviceNumber(device);
    for (const table of ['rows', 'logs']) await this.run(`ALTER TABLE tally.${table} DELETE WHERE device = ${number}`);
    await this.waitForDeletion(number);
  }

  /** The server deletes later, and answers meanwhile with the old parts. Gives up when nothing is done any more. */
  async waitForDeletion(number) {
    const [[reported]] = await this.query("SELECT count() FROM system.columns WHERE database = 'system' AND " +
      "table = 'mutations' AND name = 'latest_fail_reason'");
    const columns = `table, parts_to_do, ${reported > 0 ? 'latest_fail_reason' : "''"}`;
    let former;
    for (let end; ;) {
      const left = await this.query(`SELECT ${columns} FROM system.mutations WHERE database = 'tally' AND is_done = 0 ` +
        `AND position(command, '${number}') > 0 ORDER BY table`);
      if (left.length === 0) return;
      const [table, parts, reason] = left.find(row => row[2] !== '') ?? left[0];
      const state = JSON.stringify(left.map(row => row[1]));
      if (state !== former) end = Date.now() + LONGEST_STANDSTILL;
      former = state;
      if (reason !== '' || Date.now() > end) {
        throw new FleetError(`${this.host}:${this.port} has not deleted all of the device: ${parts} parts of tally.${table} ` +
          `are left, ${reason === '' ? `and none was done in ${LONGEST_STANDSTILL / 60000} minutes` : reason.slice(0, 400)}`);
      }
      await new Promise(resolve => setTimeout(resolve, 100));
    }
  }

  send(parameters, ...body) {
    const path = `/?${new URLSearchParams({ ...SETTINGS, ...parameters })}`;
    const options = { host: this.host, port: this.port, path, method: 'POST', agent: this.agent,
      headers: { 'Content-Length': body.reduce((sum, part) => sum + Buffer.byteLength(part), 0) } };
    return new Promise((resolve, reject) => {
      const request = http.request(options, response => {
        const parts = [];
        response.on('data', part => parts.push(part)).on('error', reject).on('end', () => {
          const said = Buffer.concat(parts).toString();
          const { statusCode: status } = response;
          const short = said.slice(0, 400).replace(/\s+/g, ' ');
          if (status === 200) resolve(said);
          else reject(Object.assign(new FleetError(`the server refuses: ${short}`), { status }));
        });
      });
      request.on('error', error => reject(new FleetError(`${this.host}:${this.port}: ${error.message}`)));
      for (const part of body) request.write(part);
      request.end();
    });
  }

  close() {
    this.agent.destroy();
  }
}
