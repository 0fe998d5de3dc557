-- What the service derives, a table for each kind, with columns in place of JSON. Each event has two names, of which the
-- one that all services share is taken. `record` is the record's identifier as a number: a repeated one goes at the
-- next merge, and questions leave it out before.

CREATE TABLE fleet.stretches_local (
    record UInt64, day Date, time DateTime, device String, application String, kind String, route String,
    release String, volume Float32, seconds Float32
) ENGINE = ReplacingMergeTree() PARTITION BY day ORDER BY (application, route, device, time, record);
CREATE TABLE fleet.stretches AS fleet.stretches_local
ENGINE = Distributed(fleet, fleet, stretches_local, cityHash64(device));
CREATE MATERIALIZED VIEW fleet.to_stretches TO fleet.stretches_local AS
SELECT cityHash64(id) AS record, day, toDateTime(intDiv(time, 1000000000)) AS time, device, application, kind,
       visitParamExtractString(fields, 'active_devices') AS route, release,
       toFloat32(visitParamExtractFloat(fields, 'QVSessionVolume')) AS volume,
       toFloat32(visitParamExtractFloat(fields, 'play_seconds')) AS seconds
FROM fleet.incoming WHERE day != toDate(0) AND event = 'com.vandra.tamblo.Volume.Summary';

CREATE TABLE fleet.group_stretches_local (
    record UInt64, day Date, device String, application String, kind String, route String, seconds Float32
) ENGINE = ReplacingMergeTree() PARTITION BY day ORDER BY (application, route, device, record);
CREATE TABLE fleet.group_stretches AS fleet.group_stretches_local
ENGINE = Distributed(fleet, fleet, group_stretches_local, cityHash64(device));
CREATE MATERIALIZED VIEW fleet.to_group_stretches TO fleet.group_stretches_local AS
SELECT cityHash64(id) AS record, day, device, application, kind,
       visitParamExtractString(fields, 'active_devices') AS route,
       toFloat32(visitParamExtractFloat(fields, 'play_seconds')) AS seconds
FROM fleet.incoming WHERE day != toDate(0) AND event = 'com.vandra.tamblo.Kaleen.Summary';

CREATE TABLE fleet.input_stretches_local (
    record UInt64, day Date, device String, application String, kind String, route String, mode String,
    seconds Float32
) ENGINE = ReplacingMergeTree() PARTITION BY day ORDER BY (mode, application, device, record);
CREATE TABLE fleet.input_stretches AS fleet.input_stretches_local
ENGINE = Distributed(fleet, fleet, input_stretches_local, cityHash64(device));
CREATE MATERIALIZED VIEW fleet.to_input_stretches TO fleet.input_stretches_local AS
SELECT cityHash64(id) AS record, day, device, application, kind,
       visitParamExtractString(fields, 'active_devices') AS route,
       visitParamExtractString(fields, 'vp_config_operation_mode') AS mode,
       toFloat32(visitParamExtractFloat(fields, 'inputrunning_seconds')) AS seconds
FROM fleet.incoming WHERE day != toDate(0) AND event = 'com.vandra.tamblo.Input.Summary';

-- Stops of sessions.
CREATE TABLE fleet.sessions_local (
    record UInt64, day Date, time DateTime, device String, application String, service String, kind String,
    release String, driver String, driver_version String, active_seconds Float64, overloads UInt32,
    messages UInt32, repeated UInt32, is_hot UInt8
) ENGINE = ReplacingMergeTree() PARTITION BY day ORDER BY (application, device, time, record);
CREATE TABLE fleet.sessions AS fleet.sessions_local
ENGINE = Distributed(fleet, fleet, sessions_local, cityHash64(device));
CREATE MATERIALIZED VIEW fleet.to_sessions TO fleet.sessions_local AS
SELECT cityHash64(id) AS record, day, toDateTime(intDiv(time, 1000000000)) AS time, device, application,
       visitParamExtractString(fields, 'summaryServiceName') AS service, kind, release, driver, driver_version,
       visitParamExtractFloat(fields, 'total_active_time') AS active_seconds,
       toUInt32(visitParamExtractUInt(fields, 'overload_count')) AS overloads,
       toUInt32(visitParamExtractUInt(fields, 'num_messages')) AS messages,
       toUInt32(visitParamExtractUInt(fields, 'num_redundant_messages')) AS repeated,
       toUInt8(visitParamExtractString(fields, 'thermal_state') IN ('Serious', 'Critical')) AS is_hot
FROM fleet.incoming WHERE day != toDate(0) AND event = 'com.vandra.tamblo.Session_Generic.Summary';

CREATE TABLE fleet.accessories_local (
    record UInt64, day Date, device String, model String, first_seen Date
) ENGINE = ReplacingMergeTree() PARTITION BY day ORDER BY (model, device, record);
CREATE TABLE fleet.accessories AS fleet.accessories_local
ENGINE = Distributed(fleet, fleet, accessories_local, cityHash64(device));
CREATE MATERIALIZED VIEW fleet.to_accessories TO fleet.accessories_local AS
SELECT cityHash64(id) AS record, day, device, visitParamExtractString(fields, 'model') AS model,
       toDateOrZero(visitParamExtractString(fields, 'first_seen_day')) AS first_seen
FROM fleet.incoming WHERE day != toDate(0) AND event = 'com.vandra.tamblo.accessoryregistration';

-- What a device says of itself when its own session begins. A load looks here what the others of its records come from.
-- Messages of that name without a kind are somebody else's.
CREATE TABLE fleet.devices_local (
    day Date, device String, time UInt64, kind String, release String, driver String, driver_version String
) ENGINE = ReplacingMergeTree() PARTITION BY day ORDER BY (device, time);
CREATE TABLE fleet.devices AS fleet.devices_local
ENGINE = Distributed(fleet, fleet, devices_local, cityHash64(device));
CREATE MATERIALIZED VIEW fleet.to_devices TO fleet.devices_local AS
SELECT day, device, time, visitParamExtractString(fields, 'device_kind') AS kind,
       visitParamExtractString(fields, 'software_release') AS release,
       visitParamExtractString(fields, 'audio_driver') AS driver,
       visitParamExtractString(fields, 'audio_driver_version') AS driver_version
FROM fleet.incoming WHERE day != toDate(0) AND event = 'com.vandra.tamblo.HAL_Generic.Start'
  AND visitParamExtractString(fields, 'device_kind') != '';
