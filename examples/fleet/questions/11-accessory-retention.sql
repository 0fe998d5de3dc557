-- How long accessories stay in use, by model: of those first seen so many days before their device was last heard, or
-- earlier, the share that was seen that many days after, or later. Of accessories from before the oldest day that is
-- kept only those are known that are still in use, and of those on devices that fell silent nothing more: neither count.
SELECT model, after, count() AS accessories, sum(last_seen >= first_seen + after) / count() AS retained
FROM (
    SELECT device, model, min(first_seen) AS first_seen, max(day) AS last_seen
    FROM fleet.accessories WHERE device != '' GROUP BY model, device
) AS one ANY LEFT JOIN (
    SELECT device, max(day) AS last_heard FROM fleet.daily_devices GROUP BY device
) AS other USING (device) ARRAY JOIN [1, 3, 7, 14] AS after
WHERE first_seen >= (SELECT min(day) FROM fleet.daily_devices) AND first_seen + after <= last_heard
GROUP BY model, after ORDER BY model, after
