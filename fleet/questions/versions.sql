-- Versions that send a key, the one seen first before the others.
SELECT version, @uniq(device) AS devices, min(day) AS since FROM {all_rows}
WHERE key = {key} AND day BETWEEN {first} AND {last} AND (kind = 'scalar' OR @finite(mean)) AND version <> ''
GROUP BY version ORDER BY since, version
