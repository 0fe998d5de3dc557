-- Hours in group playback, by application and kind of device, and on how many devices.
SELECT application, kind, sum(seconds) / 3600 AS hours, uniqExact(device) AS devices
FROM (SELECT DISTINCT record, application, kind, device, seconds FROM fleet.group_stretches)
GROUP BY application, kind ORDER BY hours DESC, application, kind
