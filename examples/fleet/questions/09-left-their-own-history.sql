-- Devices whose overloads left their own history: in the last five days many more than at their own rate before (five
-- deviations of a count, and five overloads at least). Devices without sound before, or now, have no rate to compare.
SELECT device, now_kind AS kind, (overloads + 0.5) / (hours + 1) AS before_rate, now_overloads / now_hours AS now_rate,
       before_rate * now_hours AS expected, (now_overloads - expected) / sqrt(expected) AS deviations
FROM (
    SELECT device, any(kind) AS now_kind, sum(overloads) AS now_overloads, sum(active_seconds) / 3600 AS now_hours
    FROM fleet.daily_devices WHERE day > (SELECT max(day) FROM fleet.daily_devices) - 5 GROUP BY device
) AS one ANY LEFT JOIN (
    SELECT device, sum(overloads) AS overloads, sum(active_seconds) / 3600 AS hours
    FROM fleet.daily_devices WHERE day <= (SELECT max(day) FROM fleet.daily_devices) - 5 GROUP BY device
) AS other USING (device)
WHERE hours > 0 AND now_hours > 0 AND device != '' AND now_overloads >= 5 AND deviations > 5
ORDER BY deviations DESC, device
