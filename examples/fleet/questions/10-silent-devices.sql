-- Devices that have fallen silent: heard on most days since their first, and not in the last three.
SELECT device, any(kind) AS kind, max(day) AS last_day, uniqExact(day) AS days
FROM fleet.daily_devices
WHERE device != ''
GROUP BY device
HAVING last_day <= (SELECT max(day) FROM fleet.daily_devices) - 3
   AND days >= 0.5 * (toUInt16(last_day) - toUInt16(min(day)) + 1)
ORDER BY device
