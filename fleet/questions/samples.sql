-- The distributions of a key, one row for each device, by its last log of a day: what one device may move is
-- known only then.
SELECT day, of_version, device, argMax(n_of_log, sequence) AS n, argMax(m_of_log, sequence) AS m,
  argMax(s_of_log, sequence) AS s
FROM (
  SELECT day, {version} AS of_version, device, sequence, @float(count) AS n_of_log, @known(mean) AS m_of_log,
    @known(squared_deviations) AS s_of_log
  FROM {rows}
  WHERE key = {key} AND day BETWEEN {first} AND {last} AND kind = 'distribution' AND count > 0
    AND @finite(mean) AND @finite(squared_deviations)) AS logs_of_key
GROUP BY day, of_version, device
