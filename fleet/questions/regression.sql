-- For each version: how many devices, the 99th percentile, and the middle 80 % as count, least, greatest,
-- and sums around the median. The means of few devices may be far from those of all others.
SELECT version, devices, tail, middle, cut, least_kept, greatest_kept, sum(y - middle), sum((y - middle) * (y - middle))
FROM (
  SELECT version, length(s) AS devices, s[@integer(ceil(0.99 * length(s)))] AS tail,
    s[@integer(ceil(0.5 * length(s)))] AS middle, @integer(floor(0.1 * length(s))) AS cut,
    s[@integer(floor(0.1 * length(s))) + 1] AS least_kept,
    s[@integer(length(s)) - @integer(floor(0.1 * length(s)))] AS greatest_kept,
    @explode(@slice(s, @integer(floor(0.1 * length(s))) + 1, @integer(length(s)) - @integer(floor(0.1 * length(s))))) AS y
  FROM (SELECT version, @sorted(y) AS s FROM ({means}) AS m GROUP BY version) AS g) AS kept
GROUP BY version, devices, tail, middle, cut, least_kept, greatest_kept
