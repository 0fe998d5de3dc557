-- Applications that say the same again and again: of their messages, the share that repeated the one before.
SELECT application, sum(messages) AS said, sum(repeated) / said AS repeated_share
FROM fleet.daily_sessions
GROUP BY application HAVING said > 0 ORDER BY repeated_share DESC, application
