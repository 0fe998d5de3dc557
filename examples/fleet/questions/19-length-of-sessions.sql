-- How long sessions are active, by application: quartiles and the longest in a hundred, in minutes.
SELECT application, count() AS sessions, quantileExact(0.25)(active_seconds) / 60 AS lower,
       quantileExact(0.5)(active_seconds) / 60 AS median, quantileExact(0.75)(active_seconds) / 60 AS upper,
       quantileExact(0.99)(active_seconds) / 60 AS longest
FROM (SELECT DISTINCT record, application, active_seconds FROM fleet.sessions WHERE active_seconds > 0)
GROUP BY application ORDER BY application
