-- What has arrived in ARRIVALS, each record once, without what has come before. A record gets what its device had said
-- last by the end of that day; those from before its first word, that one. Devices without a name are not one device.
INSERT INTO fleet.incoming
SELECT id, device, version, sink, day, time, event, session, application, service, fields,
       kind, release, driver, driver_version
FROM (
    SELECT id, device, version, sink, day, time, event, session, application, service, fields
    FROM fleet.ARRIVALS
    WHERE id NOT IN (
        SELECT id FROM fleet.records_local WHERE device IN (SELECT device FROM fleet.ARRIVALS)
          AND day IN (SELECT day FROM fleet.ARRIVALS))
    LIMIT 1 BY id
) AS fresh ANY LEFT JOIN (
    SELECT device, day, argMax(said_kind, nearness) AS kind, argMax(said_release, nearness) AS release,
           argMax(said_driver, nearness) AS driver, argMax(said_driver_version, nearness) AS driver_version
    FROM (
        SELECT device, day, if(said_day <= day, toInt64(said), -toInt64(said)) AS nearness,
               said_kind, said_release, said_driver, said_driver_version
        FROM (SELECT DISTINCT device, day FROM fleet.ARRIVALS WHERE device != '') AS days ALL INNER JOIN (
            SELECT device, day AS said_day, time AS said, visitParamExtractString(fields, 'device_kind') AS said_kind,
                   visitParamExtractString(fields, 'software_release') AS said_release,
                   visitParamExtractString(fields, 'audio_driver') AS said_driver,
                   visitParamExtractString(fields, 'audio_driver_version') AS said_driver_version
            FROM fleet.ARRIVALS
            WHERE event = 'com.vandra.tamblo.HAL_Generic.Start' AND day != toDate(0) AND said_kind != ''
            UNION ALL
            SELECT device, day AS said_day, time AS said, kind AS said_kind, release AS said_release,
                   driver AS said_driver, driver_version AS said_driver_version
            FROM fleet.devices_local WHERE device IN (SELECT device FROM fleet.ARRIVALS)
        ) AS statements USING (device)
    ) GROUP BY device, day
) AS of_day USING (device, day)
