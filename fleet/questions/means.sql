-- One figure for each device and version: devices are independent of each other, days are not.
SELECT version, device, avg(x) AS y FROM ({values}) AS v WHERE version IN ({baseline}, {candidate}) GROUP BY version, device
