-- Quantiles of the days until the limit is reached.
SELECT s[@integer(ceil({level} * length(s)))], s[@integer(ceil({support} * length(s)))], s[@integer(ceil(0.5 * length(s)))]
FROM (SELECT @sorted(remaining) AS s FROM ({fits}) AS f) AS g
