-- What each device reports for a key: its scalar, or the mean of its distribution.
SELECT day, of_version AS version, device, avg(value_of_day) AS x FROM (
  SELECT day, {version} AS of_version, device, CASE WHEN kind = 'scalar' THEN @float(value) ELSE @known(mean) END AS value_of_day
  FROM {rows}
  WHERE key = {key} AND day BETWEEN {first} AND {last} AND (kind = 'scalar' OR @finite(mean))) AS of_key
GROUP BY day, of_version, device
