-- Daily figures: sums that a merge brings together, so questions add up what stands there. They count what passes, so a
-- record that passed twice would count twice: `load` leaves repeats out before, and `rebuild` makes a day anew.

CREATE TABLE fleet.daily_playback_local (
    day Date, application String, kind String, route String, release String, stretches UInt64, seconds Float64
) ENGINE = SummingMergeTree() PARTITION BY day ORDER BY (day, application, kind, route, release);
CREATE TABLE fleet.daily_playback AS fleet.daily_playback_local
ENGINE = Distributed(fleet, fleet, daily_playback_local);
CREATE MATERIALIZED VIEW fleet.to_daily_playback TO fleet.daily_playback_local AS
SELECT day, application, kind, visitParamExtractString(fields, 'active_devices') AS route, release,
       count() AS stretches, sum(visitParamExtractFloat(fields, 'play_seconds')) AS seconds
FROM fleet.incoming WHERE day != toDate(0) AND event = 'com.vandra.tamblo.Volume.Summary'
GROUP BY day, application, kind, route, release;

-- Of each class of volume, which are sixteenths.
CREATE TABLE fleet.daily_volumes_local (
    day Date, kind String, route String, release String, volume Float32, seconds Float64
) ENGINE = SummingMergeTree() PARTITION BY day ORDER BY (day, kind, route, release, volume);
CREATE TABLE fleet.daily_volumes AS fleet.daily_volumes_local
ENGINE = Distributed(fleet, fleet, daily_volumes_local);
CREATE MATERIALIZED VIEW fleet.to_daily_volumes TO fleet.daily_volumes_local AS
SELECT day, kind, visitParamExtractString(fields, 'active_devices') AS route, release,
       toFloat32OrZero(visitParamExtractString(fields, 'QVSessionVolumeBucketed')) AS volume,
       sum(visitParamExtractFloat(fields, 'play_seconds')) AS seconds
FROM fleet.incoming WHERE day != toDate(0) AND event = 'com.vandra.tamblo.Volume.Summary'
GROUP BY day, kind, route, release, volume;

CREATE TABLE fleet.daily_sessions_local (
    day Date, application String, service String, kind String, driver String, driver_version String, release String,
    sessions UInt64, overloaded UInt64, overloads UInt64, active_seconds Float64, messages UInt64, repeated UInt64,
    hot UInt64
) ENGINE = SummingMergeTree() PARTITION BY day
ORDER BY (day, application, service, kind, driver, driver_version, release);
CREATE TABLE fleet.daily_sessions AS fleet.daily_sessions_local
ENGINE = Distributed(fleet, fleet, daily_sessions_local);
CREATE MATERIALIZED VIEW fleet.to_daily_sessions TO fleet.daily_sessions_local AS
SELECT day, application, visitParamExtractString(fields, 'summaryServiceName') AS service, kind, driver,
       driver_version, release, count() AS sessions,
       sum(visitParamExtractUInt(fields, 'overload_count') > 0) AS overloaded,
       sum(visitParamExtractUInt(fields, 'overload_count')) AS overloads,
       sum(visitParamExtractFloat(fields, 'total_active_time')) AS active_seconds,
       sum(visitParamExtractUInt(fields, 'num_messages')) AS messages,
       sum(visitParamExtractUInt(fields, 'num_redundant_messages')) AS repeated,
       sum(visitParamExtractString(fields, 'thermal_state') IN ('Serious', 'Critical')) AS hot
FROM fleet.incoming WHERE day != toDate(0) AND event = 'com.vandra.tamblo.Session_Generic.Summary'
GROUP BY day, application, service, kind, driver, driver_version, release;

CREATE TABLE fleet.daily_issues_local (
    day Date, issue String, kind String, driver_version String, release String, issues UInt64
) ENGINE = SummingMergeTree() PARTITION BY day ORDER BY (day, issue, kind, driver_version, release);
CREATE TABLE fleet.daily_issues AS fleet.daily_issues_local
ENGINE = Distributed(fleet, fleet, daily_issues_local);
CREATE MATERIALIZED VIEW fleet.to_daily_issues TO fleet.daily_issues_local AS
SELECT day, visitParamExtractString(fields, 'issue_type') AS issue, kind, driver_version, release,
       count() AS issues
FROM fleet.incoming WHERE day != toDate(0) AND startsWith(event, 'com.vandra.tamblo.') AND endsWith(event, '.IssueDetector')
GROUP BY day, issue, kind, driver_version, release;

CREATE TABLE fleet.daily_haptics_local (
    day Date, application String, kind String, release String, uses UInt64, seconds Float64
) ENGINE = SummingMergeTree() PARTITION BY day ORDER BY (day, application, kind, release);
CREATE TABLE fleet.daily_haptics AS fleet.daily_haptics_local
ENGINE = Distributed(fleet, fleet, daily_haptics_local);
CREATE MATERIALIZED VIEW fleet.to_daily_haptics TO fleet.daily_haptics_local AS
SELECT day, application, kind, release, count() AS uses,
       sum(visitParamExtractFloat(fields, 'EngineOnDuration')) AS seconds
FROM fleet.incoming WHERE day != toDate(0) AND event = 'Korvell_Haptics_EngineOnDuration'
GROUP BY day, application, kind, release;

-- Of each device: how much is heard of it, and how its sessions went.
CREATE TABLE fleet.daily_devices_local (
    day Date, device String, kind String, release String, records UInt64, bytes UInt64, overloads UInt64,
    active_seconds Float64
) ENGINE = SummingMergeTree() PARTITION BY day ORDER BY (device, day, kind, release);
CREATE TABLE fleet.daily_devices AS fleet.daily_devices_local
ENGINE = Distributed(fleet, fleet, daily_devices_local, cityHash64(device));
CREATE MATERIALIZED VIEW fleet.to_daily_devices TO fleet.daily_devices_local AS
SELECT day, device, kind, release, count() AS records, sum(length(fields)) AS bytes,
       sumIf(visitParamExtractUInt(fields, 'overload_count'), event = 'com.vandra.tamblo.Session_Generic.Summary')
           AS overloads,
       sumIf(visitParamExtractFloat(fields, 'total_active_time'),
             event = 'com.vandra.tamblo.Session_Generic.Summary') AS active_seconds
FROM fleet.incoming WHERE day != toDate(0) GROUP BY day, device, kind, release;
