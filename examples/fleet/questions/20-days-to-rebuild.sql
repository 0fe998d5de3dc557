-- Days of the last seven whose daily figures are not those of the records: where a server ended in the middle of a load.
-- `run PLACE rebuild DAY` puts them right.
SELECT day, counted, kept
FROM (
    SELECT day, sum(records) AS counted FROM fleet.daily_devices
    WHERE day > (SELECT max(day) FROM fleet.daily_devices) - 7 GROUP BY day
) AS one ANY LEFT JOIN (
    SELECT day, uniqExact(cityHash64(id)) AS kept FROM fleet.records
    WHERE day > (SELECT max(day) FROM fleet.daily_devices) - 7 GROUP BY day
) AS other USING (day)
WHERE counted != kept ORDER BY day
