-- The table of one sink, SINK_TABLE of SINK_NAME. In the order of devices, so that what one of them said is read at
-- once, and so that a load finds quickly what of it has come before. A record that comes again all the same goes at
-- the next merge. Views are written in the order of their names, and this one last: of a record that is kept nothing
-- else is missing, and one that is not comes again, which its day's figures show.
CREATE TABLE fleet.sink_SINK_TABLE_local (
    id String, device String, version String, day Date, time UInt64, event String, session String,
    application String, service String, fields String,
    kind String, release String, driver String, driver_version String
) ENGINE = ReplacingMergeTree() PARTITION BY day ORDER BY (device, time, id);
CREATE TABLE fleet.sink_SINK_TABLE AS fleet.sink_SINK_TABLE_local
ENGINE = Distributed(fleet, fleet, sink_SINK_TABLE_local, cityHash64(device));
CREATE MATERIALIZED VIEW fleet.what_is_kept_SINK_TABLE TO fleet.sink_SINK_TABLE_local AS
SELECT id, device, version, day, time, event, session, application, service, fields,
       kind, release, driver, driver_version
FROM fleet.incoming WHERE sink = 'SINK_NAME';
