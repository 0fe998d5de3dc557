-- How long accessories stay in use, by model: of those first seen at least so many days ago, the share that was seen that
-- many days after, or later.
SELECT model, after, count() AS accessories, sum(last_seen >= first_seen + after) / count() AS retained
FROM (
    SELECT model, device, min(first_seen) AS first_seen, max(day) AS last_seen
    FROM fleet.accessories GROUP BY model, device
) ARRAY JOIN [1, 3, 7, 14] AS after
WHERE first_seen + after <= (SELECT max(day) FROM fleet.daily_devices)
GROUP BY model, after ORDER BY model, after
