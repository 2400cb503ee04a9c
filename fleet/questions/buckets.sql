-- The histograms of a key, one row for each bucket of a device, by its last log of a day.
SELECT day, of_version, device, lower[i + 1] AS low, upper[i + 1] AS high, counts[i + 1] AS samples
FROM (
  SELECT day, of_version, device, lower, upper, counts, @explode(@indices(length(counts))) AS i
  FROM (
    SELECT day, of_version, device, argMax(lower_of_log, sequence) AS lower, argMax(upper_of_log, sequence) AS upper,
      argMax(counts_of_log, sequence) AS counts
    FROM (
      SELECT day, {version} AS of_version, device, sequence, lower AS lower_of_log, upper AS upper_of_log,
        counts AS counts_of_log
      FROM {rows}
      WHERE key = {key} AND day BETWEEN {first} AND {last} AND kind = 'distribution' AND count > 0
        AND @finite(mean) AND @finite(squared_deviations)) AS logs_of_key
    GROUP BY day, of_version, device) AS last_logs
  WHERE length(lower) = length(counts) AND length(upper) = length(counts)) AS exploded
