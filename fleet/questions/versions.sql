-- Versions that send a key, the one seen first before the others.
SELECT version, @uniq(device) AS devices, min(day) AS since FROM ({values}) AS v
WHERE version <> '' GROUP BY version ORDER BY since, version
