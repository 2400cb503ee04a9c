-- Devices by wear.
SELECT @integer(floor(level / {step})) AS bucket, count(*) FROM ({fits}) AS f GROUP BY bucket ORDER BY bucket
