-- The histograms of a key, one row for each bucket of a log.
SELECT day, {version} AS of_version, device, lower[i + 1] AS low, upper[i + 1] AS high, counts[i + 1] AS samples
FROM (
  SELECT day, version, device, lower, upper, counts, @explode(@indices(length(counts))) AS i
  FROM {rows}
  WHERE key = {key} AND day BETWEEN {first} AND {last} AND kind = 'distribution' AND count > 0
    AND @finite(mean) AND @finite(squared_deviations)
    AND length(lower) = length(counts) AND length(upper) = length(counts)) AS exploded
