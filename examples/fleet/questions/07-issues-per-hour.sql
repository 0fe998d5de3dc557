-- How many issues a release raises in an hour of sound, by kind of device, with the 95 % bounds of a count.
SELECT kind, release, issues, hours, issues / hours AS rate,
       pow(greatest(sqrt(issues + 0.375) - 0.98, 0), 2) / hours AS low, pow(sqrt(issues + 0.375) + 0.98, 2) / hours AS high
FROM (
    SELECT kind, release, sum(active_seconds) / 3600 AS hours FROM fleet.daily_sessions GROUP BY kind, release
) AS one ANY LEFT JOIN (
    SELECT kind, release, sum(issues) AS issues FROM fleet.daily_issues GROUP BY kind, release
) AS other USING (kind, release)
WHERE hours > 0 ORDER BY kind, release
