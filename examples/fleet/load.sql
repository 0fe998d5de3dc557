-- What has arrived in ARRIVALS, without what has come before. Where a device has said what it is on that day, its records
-- get that, else what it said last.
INSERT INTO fleet.incoming
SELECT id, device, version, sink, day, time, event, session, application, service, fields,
       if(kind = '', last_kind, kind), if(kind = '', last_release, release),
       if(kind = '', last_driver, driver), if(kind = '', last_driver_version, driver_version)
FROM (
    SELECT * FROM (
        SELECT id, device, version, sink, day, time, event, session, application, service, fields
        FROM fleet.ARRIVALS
        WHERE id NOT IN (
            SELECT id FROM fleet.records_local WHERE device IN (SELECT device FROM fleet.ARRIVALS)
              AND day IN (SELECT day FROM fleet.ARRIVALS))
    ) AS fresh ANY LEFT JOIN (
        SELECT device, day, argMax(said_kind, time) AS kind, argMax(said_release, time) AS release,
               argMax(said_driver, time) AS driver, argMax(said_driver_version, time) AS driver_version
        FROM (
            SELECT device, day, time, visitParamExtractString(fields, 'device_kind') AS said_kind,
                   visitParamExtractString(fields, 'software_release') AS said_release,
                   visitParamExtractString(fields, 'audio_driver') AS said_driver,
                   visitParamExtractString(fields, 'audio_driver_version') AS said_driver_version
            FROM fleet.ARRIVALS WHERE event = 'com.vandra.tamblo.HAL_Generic.Start'
            UNION ALL
            SELECT device, day, time, kind AS said_kind, release AS said_release, driver AS said_driver,
                   driver_version AS said_driver_version
            FROM fleet.devices_local WHERE device IN (SELECT device FROM fleet.ARRIVALS)
        ) GROUP BY device, day
    ) AS of_day USING (device, day)
) AS of_days ANY LEFT JOIN (
    SELECT device, argMax(kind, time) AS last_kind, argMax(release, time) AS last_release,
           argMax(driver, time) AS last_driver, argMax(driver_version, time) AS last_driver_version
    FROM fleet.devices_local WHERE device IN (SELECT device FROM fleet.ARRIVALS) GROUP BY device
) AS last USING (device)
