-- A line for each device through its wear over the days: the level on the reference day, and the days
-- from then on until it reaches the limit. Without a rise it is reached in the far future.
SELECT device, level, CASE WHEN slope > 0 THEN least(({limit} - level) / slope, {never}) ELSE {never} END AS remaining
FROM (
  SELECT device, slope, (sum_y - slope * sum_t) / days AS level
  FROM (
    SELECT device, days, sum_t, sum_y, (days * sum_ty - sum_t * sum_y) / (days * sum_tt - sum_t * sum_t) AS slope
    FROM (
      SELECT device, @float(count(*)) AS days, sum(t) AS sum_t, sum(x) AS sum_y, sum(t * t) AS sum_tt, sum(t * x) AS sum_ty
      FROM (SELECT device, @float(day) - {last} AS t, x FROM ({values}) AS v) AS points
      GROUP BY device HAVING max(t) - min(t) >= {shortest}) AS sums) AS slopes) AS lines
