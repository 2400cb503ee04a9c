-- Histograms are merged by sums: devices and samples in each bucket.
SELECT day, of_version, low, high, @uniq(device), sum(samples) FROM ({buckets}) AS b
GROUP BY day, of_version, low, high
