-- How long the haptic engine runs for a second of sound in the applications that use it, by release.
SELECT release, engine_seconds, sound_seconds, engine_seconds / sound_seconds AS engine_share
FROM (
    SELECT release, sum(seconds) AS engine_seconds FROM fleet.daily_haptics GROUP BY release
) AS one ANY LEFT JOIN (
    SELECT release, sum(active_seconds) AS sound_seconds FROM fleet.daily_sessions
    WHERE application GLOBAL IN (SELECT application FROM fleet.daily_haptics) GROUP BY release
) AS other USING (release)
ORDER BY release
