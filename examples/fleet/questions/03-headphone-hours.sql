-- Hours of playback on headphones and earbuds in the last seven days, by application and kind of device.
SELECT application, kind, sum(seconds) / 3600 AS hours
FROM fleet.daily_playback
WHERE day > (SELECT max(day) FROM fleet.daily_playback) - 7 AND route IN ('Headphones', 'Wireless Earbuds')
GROUP BY application, kind ORDER BY hours DESC, application, kind
