-- For each key, of the devices that sent it in the former days and still report: how many, how many of
-- them no longer send it, and the latest day that was the last one for K of those.
SELECT key, sum(devices) AS senders, sum(CASE WHEN last_day < {recent} THEN devices ELSE 0 END) AS silent,
  max(CASE WHEN last_day < {recent} AND devices >= {k} THEN last_day ELSE 0 END)
FROM (
  SELECT key, last_day, count(*) AS devices
  FROM (
    SELECT key, device, min(day) AS first_day, max(day) AS last_day FROM {all_rows}
    WHERE day BETWEEN {first} AND {last} GROUP BY key, device) AS sent
  INNER JOIN (
    SELECT DISTINCT device FROM {all_logs} WHERE state = 'kept' AND day BETWEEN {recent} AND {last}) AS reporting
  USING (device)
  WHERE first_day < {recent}
  GROUP BY key, last_day) AS by_day
GROUP BY key HAVING sum(CASE WHEN last_day < {recent} THEN devices ELSE 0 END) > 0
ORDER BY key
