-- What `tambloctl export --format columns` writes, as it comes in: a table for each load, gone after it. A time that
-- cannot be is the first day of 1970, so that no device's clock makes partitions as it likes.
CREATE TABLE fleet.ARRIVALS (
    id String, device String, version String, sink String, time UInt64, event String, session String,
    application String, service String, fields String,
    day Date DEFAULT if(toInt64(intDiv(time, 86400000000000)) - toInt64(toUInt16(today())) BETWEEN -400 AND 1,
                        toDate(toUInt16(intDiv(time, 86400000000000))), toDate(0))
) ENGINE = StripeLog
