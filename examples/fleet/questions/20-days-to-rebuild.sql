-- Days of the last seven whose daily figures are not those of the records: where a server ended in the middle of a load.
-- `run PLACE rebuild DAY` puts them right.
SELECT day, sum(summed) AS counted, sum(stored) AS kept
FROM (
    SELECT day, sum(records) AS summed, toUInt64(0) AS stored FROM fleet.daily_devices
    WHERE day > (SELECT max(day) FROM fleet.daily_devices) - 7 GROUP BY day
    UNION ALL
    SELECT day, toUInt64(0) AS summed, uniqExact(cityHash64(id)) AS stored FROM fleet.records
    WHERE day > (SELECT max(day) FROM fleet.daily_devices) - 7 GROUP BY day
)
GROUP BY day HAVING counted != kept ORDER BY day
