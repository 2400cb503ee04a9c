-- Devices that ran both versions: how many there are, and whose figure rose or fell by half.
SELECT count(*), sum(CASE WHEN after > {factor} * before THEN 1 ELSE 0 END),
  sum(CASE WHEN before > {factor} * after THEN 1 ELSE 0 END)
FROM (
  SELECT device, sum(CASE WHEN version = {baseline} THEN y ELSE 0 END) AS before,
    sum(CASE WHEN version = {candidate} THEN y ELSE 0 END) AS after
  FROM ({means}) AS m GROUP BY device HAVING count(*) = 2 AND min(y) >= 0) AS both_versions
