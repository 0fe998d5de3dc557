-- Each record comes by here, once, with what its device was on that day. Views take it on from here: those of the
-- sinks keep all of it, those of summaries.sql and days.sql what the questions are about.
CREATE DATABASE IF NOT EXISTS fleet;

CREATE TABLE fleet.incoming (
    id String, device String, version String, sink String, day Date, time UInt64, event String, session String,
    application String, service String, fields String,
    kind String, release String, driver String, driver_version String
) ENGINE = Null;

-- Every record of all sinks on this shard.
CREATE TABLE fleet.records_local (
    id String, device String, version String, day Date, time UInt64, event String, session String,
    application String, service String, fields String,
    kind String, release String, driver String, driver_version String
) ENGINE = Merge(fleet, '^sink_[a-z_]+_local$');
CREATE TABLE fleet.records AS fleet.records_local
ENGINE = Distributed(fleet, fleet, records_local, cityHash64(device));

-- Which shards there are: each has its own number.
CREATE TABLE fleet.shards_local (shard UInt32) ENGINE = TinyLog;
CREATE TABLE fleet.shards AS fleet.shards_local ENGINE = Distributed(fleet, fleet, shards_local);
