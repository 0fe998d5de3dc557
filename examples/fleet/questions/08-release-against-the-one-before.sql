-- Which releases raised issues: the share of devices with more than one overload in an hour of sound, where it is above
-- that of the release before on the same kind of device by three deviations. Devices count, not overloads, so that one
-- that is broken makes no release look bad. Releases are in the order of their numbers: 4.10 comes after 4.9.
SELECT kind, names[i] AS release, names[i - 1] AS before, rates[i] AS rate, rates[i - 1] AS rate_before,
       affected[i] / heard[i] AS share, affected[i - 1] / heard[i - 1] AS share_before,
       (affected[i] + affected[i - 1]) / (heard[i] + heard[i - 1]) AS both,
       (share - share_before) / sqrt(greatest(both * (1 - both), 0.001) * (1 / heard[i] + 1 / heard[i - 1])) AS deviations
FROM (
    SELECT kind, groupArray(release) AS names, groupArray(devices) AS heard, groupArray(above) AS affected,
           groupArray(rate) AS rates
    FROM (
        SELECT kind, release, count() AS devices, sum(overloads > hours) AS above, sum(overloads) / sum(hours) AS rate
        FROM (
            SELECT device, kind, release, sum(overloads) AS overloads, sum(active_seconds) / 3600 AS hours
            FROM fleet.daily_devices WHERE release != '' GROUP BY device, kind, release HAVING hours >= 1
        ) GROUP BY kind, release
        ORDER BY kind, arrayMap(part -> toUInt64OrZero(part), extractAll(release, '[0-9]+')), release
    ) GROUP BY kind
) ARRAY JOIN arrayEnumerate(names) AS i
WHERE i > 1 AND deviations > 3
ORDER BY deviations DESC, kind, release
