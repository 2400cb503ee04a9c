-- One row for each row of an export. The same log again gives the same sorting key, and the rows become
-- one. A device is 64 bits of its pseudonym's hash, since 32 random digits would be most of a row. The
-- mean is kept as its bits, since the server's parser of numbers may be off by the last one, which a small
-- variance beside a large mean would show.
CREATE TABLE IF NOT EXISTS tally.rows (
  device UInt64,
  sequence UInt64,
  day UInt16,
  date Date DEFAULT toDate(day),
  version String,
  configuration String,
  key String,
  kind Enum8('scalar' = 1, 'distribution' = 2),
  value Int64,
  count UInt32,
  minimum Nullable(Float64),
  maximum Nullable(Float64),
  mean_bits UInt64 DEFAULT 9221120237041090560,
  mean Float64 ALIAS reinterpretAsFloat64(reinterpretAsString(mean_bits)),
  squared_deviations Nullable(Float64),
  lower Array(Nullable(Float64)),
  upper Array(Nullable(Float64)),
  counts Array(UInt64)
) ENGINE = ReplacingMergeTree() PARTITION BY toYYYYMM(date) ORDER BY (key, day, device, sequence, kind);

-- One row for each place where a log was found: the log that is kept, and those that are not.
-- Device and sequence are 0 for a log that lacks them.
CREATE TABLE IF NOT EXISTS tally.logs (
  device UInt64,
  sequence UInt64,
  day Nullable(UInt16),
  date Date,
  version String,
  hash String,
  source String,
  state Enum8('kept' = 1, 'duplicate' = 2, 'conflict' = 3, 'bare' = 4, 'undated' = 5, 'unreadable' = 6)
) ENGINE = ReplacingMergeTree() PARTITION BY toYYYYMM(date) ORDER BY (device, sequence, hash, source);

-- How far each file has been loaded.
CREATE TABLE IF NOT EXISTS tally.files (
  name String,
  first String,
  done UInt64,
  last String
) ENGINE = ReplacingMergeTree(done) ORDER BY (name, first);
