-- The latest day that K devices agree on: a clock that is wrong does not decide what is recent.
SELECT max(day) FROM (
  SELECT day FROM {all_logs} WHERE state = 'kept' GROUP BY day HAVING @uniq(device) >= {k})
