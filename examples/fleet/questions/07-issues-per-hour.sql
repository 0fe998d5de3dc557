-- How many issues a release raises in an hour of sound, by kind of device, with the 95 % bounds of a count
-- (Byar).
SELECT kind, release, issues, hours, issues / hours AS rate,
       issues * pow(greatest(1 - 1 / (9 * greatest(issues, 1)) - 1.96 / (3 * sqrt(greatest(issues, 1))), 0), 3) / hours AS low,
       (issues + 1) * pow(1 - 1 / (9 * (issues + 1)) + 1.96 / (3 * sqrt(issues + 1)), 3) / hours AS high
FROM (
    SELECT kind, release, sum(active_seconds) / 3600 AS hours FROM fleet.daily_sessions GROUP BY kind, release
) AS one ANY LEFT JOIN (
    SELECT kind, release, sum(issues) AS issues FROM fleet.daily_issues GROUP BY kind, release
) AS other USING (kind, release)
WHERE hours > 0 ORDER BY kind, release
