// The commands of tallyfleet: what they take, and what they print.
import { parseArgs } from 'node:util';
import { ClickHouse } from './clickhouse.mjs';
import { DuckDb } from './duckdb.mjs';
import { forgetInFiles } from './forget.mjs';
import { load } from './loader.mjs';
import { FleetError, isDevice } from './logs.mjs';
import { ask, parametersFrom, parametersOf, QUESTIONS } from './questions.mjs';
import { tableOf } from './table.mjs';

class UsageError extends FleetError {}

const OPTIONS = {
  engine: { type: 'string', default: 'duckdb' },
  data: { type: 'string' },
  server: { type: 'string' },
  cluster: { type: 'string' },
  param: { type: 'string', multiple: true, default: [] },
  json: { type: 'boolean', default: false },
  help: { type: 'boolean', short: 'h', default: false },
};

const COMMANDS = {
  ask: {
    takes: ['QUESTION'], run: runAsk,
    usage: '--data DIR | --engine clickhouse --server HOST:PORT [--json] [--param NAME=VALUE]...',
  },
  convert: { takes: ['DIR'], usage: '', run: async ([directory]) => print(await DuckDb.convert(directory)) },
  schema: { takes: [], usage: '--server HOST:PORT [--cluster NAME]', run: runSchema },
  load: { takes: ['DIR'], usage: '--server HOST:PORT [--json]', run: runLoad },
  forget: { takes: ['DEVICE'], usage: '--data DIR | --server HOST:PORT', run: runForget },
};

const print = text => process.stdout.write(`${text}\n`);

function usage() {
  const commands = Object.entries(COMMANDS).map(([name, { takes, usage: rest }]) =>
    `  tallyfleet ${[name, ...takes, rest].filter(Boolean).join(' ')}`);
  const questions = Object.entries(QUESTIONS).flatMap(([name, question]) => [`  ${name.padEnd(14)}${question.summary}`,
    ...Object.entries(parametersOf(question)).map(([key, { help }]) => `    ${key.padEnd(12)}${help}`)]);
  return ['Usage:', ...commands, '', 'Questions, and their parameters:', ...questions].join('\n');
}

function serverOf({ server }) {
  const match = /^(\[[0-9a-fA-F:]+\]|[^:/]+):(\d{1,5})$/.exec(server ?? '');
  if (!match) throw new UsageError('--server HOST:PORT is needed, with the port of the HTTP interface');
  return new ClickHouse(match[1], Number(match[2]));
}

function parametersGiven(texts) {
  return Object.fromEntries(texts.map(text => {
    const at = text.indexOf('=');
    if (at < 1) throw new UsageError(`--param NAME=VALUE is needed, not ${text}`);
    return [text.slice(0, at), text.slice(at + 1)];
  }));
}

async function engineOf(options, key) {
  if (options.engine === 'clickhouse') return serverOf(options).open();
  if (options.engine !== 'duckdb') throw new UsageError(`no engine ${options.engine}: duckdb or clickhouse`);
  if (options.data === undefined) throw new UsageError('--data DIR is needed');
  return DuckDb.open(options.data, key);
}

async function runAsk([name], options) {
  if (!Object.hasOwn(QUESTIONS, name)) throw new UsageError(`no question ${name}: ${Object.keys(QUESTIONS).join(', ')}`);
  const given = parametersGiven(options.param);
  parametersFrom(name, given);
  const engine = await engineOf(options, given.key);
  try {
    const answer = await ask(engine, name, given);
    print(options.json ? JSON.stringify(answer) : tableOf(answer));
  } finally {
    engine.close();
  }
}

async function runSchema(_, options) {
  await serverOf(options).createSchema(options.cluster);
}

async function runLoad([directory], options) {
  const counts = await load(await serverOf(options).open(), directory);
  print(options.json ? JSON.stringify(counts) : Object.entries(counts).map(([name, count]) => `${name}: ${count}`).join('\n'));
}

async function runForget([device], options) {
  if (!isDevice(device)) throw new UsageError('that cannot be a device');
  if (options.server !== undefined) return (await serverOf(options).open()).forget(device);
  if (options.data === undefined) throw new UsageError('--data DIR or --server HOST:PORT is needed');
  return forgetInFiles(options.data, device);
}

/** Runs a command line; returns the exit status: 0, 1 after a failure, 2 for wrong usage. */
export async function main(argv) {
  try {
    const { values, positionals: [name, ...rest] } = parse(argv);
    if (values.help) {
      print(usage());
      return 0;
    }
    if (!Object.hasOwn(COMMANDS, name ?? '')) throw new UsageError(`a command is needed: ${Object.keys(COMMANDS).join(', ')}`);
    const command = COMMANDS[name];
    if (rest.length !== command.takes.length) throw new UsageError(`${name} takes ${command.takes.join(' ') || 'no argument'}`);
    await command.run(rest, values);
    return 0;
  } catch (error) {
    if (!(error instanceof Error)) throw error;
    process.stderr.write(`tallyfleet: ${error.message.split('\n')[0]}\n`);
    return error instanceof UsageError ? 2 : 1;
  }
}

function parse(argv) {
  try {
    return parseArgs({ args: argv, options: OPTIONS, allowPositionals: true });
  } catch (error) {
    throw new UsageError(error.message);
  }
}
