-- How releases spread: by day, the devices of each, and their share of those that were heard.
SELECT day, release, devices, devices / heard AS share
FROM (
    SELECT day, release, uniqExact(device) AS devices FROM fleet.daily_devices GROUP BY day, release
) AS one ANY LEFT JOIN (
    SELECT day, uniqExact(device) AS heard FROM fleet.daily_devices GROUP BY day
) AS other USING (day)
ORDER BY day, release
