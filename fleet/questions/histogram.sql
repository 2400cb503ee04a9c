-- Histograms are merged by sums: devices and samples in each bucket.
SELECT day, of_version, low, high, @uniq(device), sum(samples)
FROM (
  SELECT day, {version} AS of_version, device, lower[i + 1] AS low, upper[i + 1] AS high, counts[i + 1] AS samples
  FROM (
    SELECT day, version, device, lower, upper, counts, @explode(@indices(length(counts))) AS i
    FROM {rows}
    WHERE key = {key} AND day BETWEEN {first} AND {last} AND kind = 'distribution'
      AND length(lower) = length(counts) AND length(upper) = length(counts)) AS buckets) AS b
GROUP BY day, of_version, low, high
