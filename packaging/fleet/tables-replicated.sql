-- The tables of a fleet, edition 1. Rows may be there more than once until the database has merged
-- them: group by device, epoch and id, or read with FINAL.

CREATE DATABASE IF NOT EXISTS kesto ON CLUSTER fleet;

-- what each device has sent
CREATE TABLE IF NOT EXISTS kesto.batches_local ON CLUSTER fleet (
    device FixedString(32), -- the pseudonym
    epoch FixedString(32), -- of the device's store: IDs mean something only with it
    first_id UInt64, -- the IDs that the batch tells of, as far as they may leave
    last_id UInt64,
    sent Float64, -- by the device's clock
    model String, -- of the device
    version String, -- the device's release
    received DateTime DEFAULT now() -- when it was stored here
) ENGINE = ReplicatedReplacingMergeTree('/clickhouse/tables/{shard}/kesto/batches', '{replica}')
PARTITION BY toMonday(toDateTime(toUInt32(sent)))
ORDER BY (device, epoch, last_id, first_id);

CREATE TABLE IF NOT EXISTS kesto.batches ON CLUSTER fleet AS kesto.batches_local
ENGINE = Distributed(fleet, kesto, batches_local, cityHash64(device));

-- what messages told
CREATE TABLE IF NOT EXISTS kesto.events_local ON CLUSTER fleet (
    device FixedString(32), -- the pseudonym
    epoch FixedString(32), -- of the device's store: IDs mean something only with it
    id UInt64,
    happened_us Int64, -- microseconds since 1970 UTC: when it happened, or else `time`
    time Float64, -- when it was sent, by the device's clock
    happened Nullable(Float64), -- when it happened, if told
    name String,
    session UInt64, -- an ID in sessions, or 0: it belongs to none
    application String, -- empty: not known
    model String, -- of the device
    version String, -- the device's release
    payload String, -- JSON without spaces
    audio_device String, -- the payload's active_devices, up to 256 bytes
    late_cycles Float64, -- the payload's
    received DateTime DEFAULT now() -- when it was stored here
) ENGINE = ReplicatedReplacingMergeTree('/clickhouse/tables/{shard}/kesto/events', '{replica}')
PARTITION BY toMonday(toDateTime(intDiv(happened_us, 1000000)))
ORDER BY (device, epoch, id);

CREATE TABLE IF NOT EXISTS kesto.events ON CLUSTER fleet AS kesto.events_local
ENGINE = Distributed(fleet, kesto, events_local, cityHash64(device));

-- who played or recorded for how long
CREATE TABLE IF NOT EXISTS kesto.stretches_local ON CLUSTER fleet (
    device FixedString(32), -- the pseudonym
    epoch FixedString(32), -- of the device's store: IDs mean something only with it
    id UInt64,
    recording UInt8, -- 0: it played
    began_us Int64, -- microseconds since 1970 UTC. Whole numbers add up to the same in any order
    microseconds Int64, -- how long
    began Float64 DEFAULT began_us / 1000000, -- in seconds, as the next two
    seconds Float64 DEFAULT microseconds / 1000000,
    played_seconds Float64 DEFAULT if(recording, 0, seconds),
    session UInt64, -- an ID in sessions, or 0: it belongs to none
    application String, -- empty: not known
    audio_device String, -- empty: not known, as in the next
    format String,
    channels Nullable(UInt32),
    volume_millionths Nullable(UInt32), -- 0: muted, 1000000: all of the slider
    volume Nullable(Float64) DEFAULT volume_millionths / 1000000, -- from 0 to 1
    ending String,
    model String, -- of the device
    version String, -- the device's release
    received DateTime DEFAULT now() -- when it was stored here
) ENGINE = ReplicatedReplacingMergeTree('/clickhouse/tables/{shard}/kesto/stretches', '{replica}')
PARTITION BY (toMonday(toDateTime(intDiv(began_us, 1000000))), microseconds > 86400000000)
ORDER BY (device, epoch, id);

CREATE TABLE IF NOT EXISTS kesto.stretches ON CLUSTER fleet AS kesto.stretches_local
ENGINE = Distributed(fleet, kesto, stretches_local, cityHash64(device));

-- of the devices' clients
CREATE TABLE IF NOT EXISTS kesto.sessions_local ON CLUSTER fleet (
    device FixedString(32), -- the pseudonym
    epoch FixedString(32), -- of the device's store: IDs mean something only with it
    id UInt64,
    began Float64,
    ended Nullable(Float64),
    has_ended UInt8 DEFAULT isNotNull(ended), -- the row that says so stays
    reporter Int64,
    service String,
    application String, -- empty: not known
    process String,
    model String, -- of the device
    version String, -- the device's release
    received DateTime DEFAULT now() -- when it was stored here
) ENGINE = ReplicatedReplacingMergeTree('/clickhouse/tables/{shard}/kesto/sessions', '{replica}', has_ended)
PARTITION BY toMonday(toDateTime(toUInt32(began)))
ORDER BY (device, epoch, id);

CREATE TABLE IF NOT EXISTS kesto.sessions ON CLUSTER fleet AS kesto.sessions_local
ENGINE = Distributed(fleet, kesto, sessions_local, cityHash64(device));

-- A view, so that each server of a cluster has it.
CREATE VIEW IF NOT EXISTS kesto.edition ON CLUSTER fleet AS SELECT toUInt64(1) AS edition;
