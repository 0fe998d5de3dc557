-- Hours of playback in the last seven days, by application.
SELECT application, sum(seconds) / 3600 AS hours, sum(stretches) AS plays
FROM fleet.daily_playback
WHERE day > (SELECT max(day) FROM fleet.daily_playback) - 7
GROUP BY application ORDER BY hours DESC, application
