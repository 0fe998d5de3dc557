-- When people listen: minutes of playback by the hour (UTC) in which a stretch ended, and kind of device, on an average
-- day of the last seven.
SELECT toHour(time, 'UTC') AS hour, kind, sum(seconds) / 60 / 7 AS minutes
FROM (
    SELECT DISTINCT record, time, kind, seconds FROM fleet.stretches
    WHERE day > (SELECT max(day) FROM fleet.daily_playback) - 7
)
GROUP BY hour, kind ORDER BY hour, kind
