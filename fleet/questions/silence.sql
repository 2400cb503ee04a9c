-- For each key, of the devices that sent it in the former days and still report: how many, how many of
-- them no longer send it, and the last day on which one of those did.
SELECT key, count(*) AS senders, sum(CASE WHEN last_day < {recent} THEN 1 ELSE 0 END) AS silent,
  max(CASE WHEN last_day < {recent} THEN last_day ELSE 0 END)
FROM (
  SELECT key, device, min(day) AS first_day, max(day) AS last_day FROM {all_rows}
  WHERE day BETWEEN {first} AND {last} GROUP BY key, device) AS sent
INNER JOIN (
  SELECT DISTINCT device FROM {all_logs} WHERE state = 'kept' AND day BETWEEN {recent} AND {last}) AS reporting
USING (device)
WHERE first_day < {recent}
GROUP BY key HAVING sum(CASE WHEN last_day < {recent} THEN 1 ELSE 0 END) > 0
ORDER BY key
