-- Devices and logs, by state, day and version.
SELECT {day} AS of_day, {version} AS of_version, state, @uniq(device), count(*)
FROM {logs} WHERE day BETWEEN {first} AND {last} OR day IS NULL
GROUP BY of_day, of_version, state ORDER BY of_day, of_version, state
