-- Quantiles over the devices, by day and version.
SELECT day, version, length(s) AS devices,
  s[@integer(ceil(0.01 * length(s)))], s[@integer(ceil(0.05 * length(s)))], s[@integer(ceil(0.25 * length(s)))],
  s[@integer(ceil(0.5 * length(s)))],
  s[@integer(ceil(0.75 * length(s)))], s[@integer(ceil(0.95 * length(s)))], s[@integer(ceil(0.99 * length(s)))]
FROM (SELECT day, version, @sorted(x) AS s FROM ({values}) AS v GROUP BY day, version) AS g
ORDER BY day, version
