// An answer as text for a terminal.

function textOf(value) {
  if (value === null) return '-';
  if (Array.isArray(value)) return value.map(each => (each === null ? '' : textOf(each))).join(';');
  return typeof value === 'number' && !Number.isInteger(value) ? value.toPrecision(6) : String(value);
}

// A version is chosen by devices: nothing of it may steer a terminal.
const printable = text => text.replace(/[\p{Cc}\p{Cf}\p{Zl}\p{Zp}]/gu, '?');

export function tableOf({ columns, rows, withheld, k, until }) {
  const used = columns.map((_, index) => rows.some(row => row[index] !== null));
  const lines = [columns, ...rows].map(row => row.filter((_, index) => used[index]).map(value => printable(textOf(value))));
  const widths = lines[0].map((_, index) => Math.max(...lines.map(line => line[index].length)));
  const table = rows.length === 0 ? []
    : lines.map(line => line.map((text, index) => text.padEnd(widths[index])).join('  ').trimEnd());
  const summary = `${rows.length} rows until ${until ?? 'no day'}; ${withheld} withheld about fewer than ${k} devices`;
  return [...table, summary].join('\n');
}
