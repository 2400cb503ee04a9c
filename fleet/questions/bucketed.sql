-- How many devices have a histogram.
SELECT day, of_version, @uniq(device) FROM ({buckets}) AS b GROUP BY day, of_version
