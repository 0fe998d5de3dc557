-- Sessions that ended on a hot device, by kind of device, with the 95 % bounds of their share (Wilson).
SELECT kind, sessions, hot, hot / sessions AS share,
       greatest(share + 1.9208 / sessions - 1.96 * sqrt((share * (1 - share) + 0.9604 / sessions) / sessions), 0)
           / (1 + 3.8416 / sessions) AS low,
       (share + 1.9208 / sessions + 1.96 * sqrt((share * (1 - share) + 0.9604 / sessions) / sessions))
           / (1 + 3.8416 / sessions) AS high
FROM (
    SELECT kind, sum(sessions) AS sessions, sum(hot) AS hot
    FROM fleet.daily_sessions WHERE service != 'audiodeviceusage' GROUP BY kind
)
ORDER BY kind
