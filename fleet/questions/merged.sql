-- Count, mean and squared deviations of all samples. The deviations are taken from a mean that is known
-- already, and its rounding is corrected: sums of squares would lose a small variance beside a large mean.
-- Then what one log may move: of the mean, as its standard error, and the largest parts in the others.
SELECT day, of_version, devices, samples, centre + shift / samples, within + between_them - shift * shift / samples,
  error / samples, largest_count, farthest, largest_part
FROM (
  SELECT day, of_version, @uniq(device) AS devices, max(c) AS centre, sum(n) AS samples, sum(s) AS within,
    sqrt(sum(n * (m - c) * n * (m - c))) AS error, max(n) AS largest_count,
    max(abs(n * (m - c))) AS farthest, max(s + n * (m - c) * (m - c)) AS largest_part,
    sum(n * (m - c)) AS shift, sum(n * (m - c) * (m - c)) AS between_them
  FROM ({samples}) AS all_samples
  INNER JOIN (SELECT day, of_version, sum(n * m) / sum(n) AS c FROM ({samples}) AS for_mean GROUP BY day, of_version) AS means
  USING (day, of_version)
  GROUP BY day, of_version) AS sums
ORDER BY day, of_version
