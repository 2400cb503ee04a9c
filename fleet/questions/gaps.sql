-- Logs that never came, by the day of the next one, the last day if that is unknown: devices, and logs. A number may be wrong, so that a
-- gap counts for no more than a year.
SELECT {day} AS of_day, @uniq(device), sum(least(gap, 366))
FROM (
  SELECT device, s[i + 2] % 131072 AS day, @div(s[i + 2], 131072) - @div(s[i + 1], 131072) - 1 AS gap
  FROM (
    SELECT device, s, @explode(@indices(length(s) - 1)) AS i
    FROM (
      SELECT device, @sorted(@integer(sequence) * 131072 + coalesce(@integer(day), {last})) AS s FROM {all_logs}
      WHERE state IN ('kept', 'undated') GROUP BY device) AS sequences) AS neighbours) AS gaps
WHERE gap > 0 AND day BETWEEN {first} AND {last}
GROUP BY of_day ORDER BY of_day
