// The questions are one text for both engines. What the engines name differently is a macro, @NAME(...),
// and what a question is asked with is a placeholder, {NAME}.
import fs from 'node:fs';

/** The expansion of each macro; $1, $2 are its arguments. */
const MACROS = {
  uniq: { duckdb: 'count(DISTINCT $1)', clickhouse: 'uniqExact($1)' },
  sorted: { duckdb: 'list_sort(list($1))', clickhouse: 'arraySort(groupArray($1))' },
  explode: { duckdb: 'unnest($1)', clickhouse: 'arrayJoin($1)' },
  indices: { duckdb: 'range($1)', clickhouse: 'range(toUInt64($1))' },
  float: { duckdb: 'CAST($1 AS DOUBLE)', clickhouse: 'toFloat64($1)' },
  integer: { duckdb: 'CAST($1 AS BIGINT)', clickhouse: 'toInt64($1)' },
  finite: { duckdb: 'coalesce(isfinite($1), false)', clickhouse: 'ifNull(isFinite($1), 0)' },
  known: { duckdb: '$1', clickhouse: 'assumeNotNull($1)' },
  div: { duckdb: '($1) // ($2)', clickhouse: 'intDiv($1, $2)' },
  slice: { duckdb: 'list_slice($1, $2, $3)', clickhouse: 'arraySlice($1, $2, $3 - ($2) + 1)' },
};

function literal(value, dialect) {
  if (Array.isArray(value)) return value.map(each => literal(each, dialect)).join(', ');
  if (typeof value === 'number') {
    if (!Number.isFinite(value)) throw new Error(`not a number for a question: ${value}`);
    // An exponent makes it a floating-point number for both; integers stay integers.
    return Number.isSafeInteger(value) ? String(value) : value.toExponential();
  }
  const escaped = dialect === 'clickhouse' ? value.replaceAll('\\', '\\\\') : value;
  return `'${escaped.replaceAll("'", dialect === 'clickhouse' ? "\\'" : "''")}'`;
}

/** The arguments of a macro whose parenthesis opens at `open`, and where it closes. */
function argumentsAt(text, open) {
  const values = [];
  let depth = 0;
  let begin = open + 1;
  for (let at = open; at < text.length; ++at) {
    const character = text[at];
    if (character === '(' || character === '[') ++depth;
    if (character === ')' || character === ']') --depth;
    if (depth === 0 || (depth === 1 && character === ',')) {
      values.push(text.slice(begin, at).trim());
      begin = at + 1;
    }
    if (depth === 0) return { values, end: at + 1 };
  }
  throw new Error(`a macro is not closed: ${text.slice(open - 20, open + 20)}`);
}

function expanded(text, dialect) {
  const match = /@([a-z]+)\(/.exec(text);
  if (!match) return text;
  const macro = MACROS[match[1]];
  if (!macro) throw new Error(`no macro ${match[1]}`);
  const { values, end } = argumentsAt(text, match.index + match[0].length - 1);
  const body = macro[dialect].replace(/\$(\d)/g, (_, number) => values[number - 1]);
  return text.slice(0, match.index) + expanded(body + text.slice(end), dialect);
}

/**
 * The text of questions/NAME.sql with pieces in their places, which are such texts too, or names of tables
 * and columns; what the user says is never a piece.
 */
export function template(name, pieces) {
  return fs.readFileSync(new URL(`../questions/${name}.sql`, import.meta.url), 'utf8')
    .replace(/^--.*\n/gm, '').replace(/\{([a-z_]+)\}/g, (whole, key) => pieces[key] ?? whole);
}

/** The statement of a template. Values become literals, last and in one pass, so that nothing reads them again. */
export function statement(text, dialect, values) {
  return expanded(text, dialect).replace(/\{([a-z_]+)\}/g, (_, key) => {
    if (!(key in values)) throw new Error(`nothing for {${key}}`);
    return literal(values[key], dialect);
  });
}

export const quoted = literal;
