-- Devices above the baseline's 99th percentile. A device that is as high as the percentile is not above
-- it, also where an engine has added up in another order.
SELECT version, sum(CASE WHEN y - {tail} > {slack} THEN 1 ELSE 0 END) FROM ({means}) AS m GROUP BY version
