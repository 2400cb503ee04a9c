-- What each device reports for a key: its scalar, or the mean of its distribution, by the last log of a
-- day. That is the same if a log is there twice.
SELECT day, of_version AS version, device, argMax(value_of_log, sequence) AS x FROM (
  SELECT day, {version} AS of_version, device, sequence,
    CASE WHEN kind = 'scalar' THEN @float(value) ELSE @known(mean) END AS value_of_log
  FROM {all_rows}
  WHERE key = {key} AND day BETWEEN {first} AND {last} AND (kind = 'scalar' OR @finite(mean))) AS of_key
GROUP BY day, of_version, device
