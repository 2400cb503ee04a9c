// Deletes a device's data from exported files, and from what was made of them.
import fs from 'node:fs';
import { DuckDb, hasConverted } from './duckdb.mjs';
import { exportedFiles, readLogs } from './logs.mjs';

/** Rewrites a file without a device's logs; what is no log is kept out too if it names the device. */
function rewrite(file, device) {
  const part = `${file}.part`;
  const to = fs.openSync(part, 'w', fs.statSync(file).mode & 0o777);
  const from = fs.openSync(file, 'r');
  let found = false;
  try {
    for (const log of readLogs(file)) {
      let { bytes } = log;
      if (log.refused) fs.readSync(from, (bytes = Buffer.alloc(log.length)), 0, log.length, log.offset);
      if (log.refused ? bytes.includes(device) : log.header.device === device) found = true;
      else for (let at = 0; at < bytes.length;) at += fs.writeSync(to, bytes, at);
    }
    fs.fsyncSync(to);
  } finally {
    fs.closeSync(from);
    fs.closeSync(to);
  }
  if (found) fs.renameSync(part, file); else fs.rmSync(part);
}

export async function forgetInFiles(directory, device) {
  const files = exportedFiles(directory);
  for (const file of files) rewrite(file, device);
  if (hasConverted(directory)) await DuckDb.convert(directory, device);
}
