-- Hours in which the microphone ran in calls, by route, with the number of stretches and of devices.
SELECT route, sum(seconds) / 3600 AS hours, count() AS stretches, uniqExact(device) AS devices
FROM (SELECT DISTINCT record, route, device, seconds FROM fleet.input_stretches WHERE mode = 'telephony')
GROUP BY route ORDER BY hours DESC, route
