-- The distributions of a key, one row for each log.
SELECT day, {version} AS of_version, device, @float(count) AS n, @known(mean) AS m, @known(squared_deviations) AS s
FROM {rows}
WHERE key = {key} AND day BETWEEN {first} AND {last} AND kind = 'distribution' AND count > 0
  AND @finite(mean) AND @finite(squared_deviations)
