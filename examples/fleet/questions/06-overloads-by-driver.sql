-- Sessions with overloads by driver and version, of all but the device's own, with the 95 % bounds of their share
-- (Wilson).
SELECT driver, driver_version, sessions, overloaded, overloaded / sessions AS share,
       greatest(share + 1.9208 / sessions - 1.96 * sqrt((share * (1 - share) + 0.9604 / sessions) / sessions), 0)
           / (1 + 3.8416 / sessions) AS low,
       (share + 1.9208 / sessions + 1.96 * sqrt((share * (1 - share) + 0.9604 / sessions) / sessions))
           / (1 + 3.8416 / sessions) AS high
FROM (
    SELECT driver, driver_version, sum(sessions) AS sessions, sum(overloaded) AS overloaded
    FROM fleet.daily_sessions WHERE service != 'audiodeviceusage' GROUP BY driver, driver_version
)
ORDER BY driver, driver_version
