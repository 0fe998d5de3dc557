-- Hours of playback by application, route and day.
SELECT day, application, route, sum(seconds) / 3600 AS hours
FROM fleet.daily_playback
GROUP BY day, application, route ORDER BY day, application, route
