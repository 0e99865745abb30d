-- Rows as `quorletctl logs export` writes them. Loading a log again changes nothing, and of two logs
-- of one day the later one counts: rows with the same key replace each other, the youngest stays.
-- Until parts are merged both are there, so every question asks FINAL.
CREATE TABLE IF NOT EXISTS metrics
(
    key        LowCardinality(String),
    day        Date,
    device     String,
    kind       LowCardinality(String),
    created    DateTime,
    os_version LowCardinality(String),
    log        LowCardinality(String),
    whitelist  LowCardinality(String),
    tasking    LowCardinality(String),
    unit       LowCardinality(String),
    integer    Nullable(Int64),
    number     Nullable(Float64),
    text       String,
    min        Nullable(Float64),
    max        Nullable(Float64),
    mean       Nullable(Float64),
    m2         Nullable(Float64),
    count      UInt64,
    lower      Array(Nullable(Float64)),
    upper      Array(Nullable(Float64)),
    counts     Array(UInt64)
)
ENGINE = ReplacingMergeTree(created)
PARTITION BY toYYYYMM(day)
ORDER BY (key, day, device, kind)
TTL day + INTERVAL 400 DAY;

-- Roll-ups by OS version. A view that is fed by inserts would count a log that is loaded twice
-- twice; these are made anew from what FINAL leaves, once a day.
CREATE TABLE IF NOT EXISTS daily_scalars
(
    day Date, os_version LowCardinality(String), key LowCardinality(String),
    devices UInt64, total Float64, lowest Float64, highest Float64
)
ENGINE = MergeTree ORDER BY (key, day, os_version);

CREATE TABLE IF NOT EXISTS daily_distributions
(
    day Date, os_version LowCardinality(String), key LowCardinality(String),
    devices UInt64, count UInt64, mean Float64, m2 Float64, min Float64, max Float64
)
ENGINE = MergeTree ORDER BY (key, day, os_version);

CREATE TABLE IF NOT EXISTS daily_histograms
(
    day Date, os_version LowCardinality(String), key LowCardinality(String),
    lower Nullable(Float64), upper Nullable(Float64), count UInt64
)
ENGINE = MergeTree ORDER BY (key, day, os_version);

CREATE MATERIALIZED VIEW IF NOT EXISTS daily_scalars_refresh REFRESH EVERY 1 DAY TO daily_scalars AS
SELECT day, os_version, key, count() AS devices, sum(ifNull(number, 0)) AS total,
       min(ifNull(number, 0)) AS lowest, max(ifNull(number, 0)) AS highest
FROM metrics FINAL
WHERE kind = 'scalar'
GROUP BY day, os_version, key;

-- The mean of the group first: squares of large means would swallow what lies between them.
CREATE MATERIALIZED VIEW IF NOT EXISTS daily_distributions_refresh REFRESH EVERY 1 DAY
TO daily_distributions AS
WITH means AS
(
    SELECT day, os_version, key, sum(m.count * m.mean) / sum(m.count) AS middle
    FROM metrics AS m FINAL
    WHERE kind = 'distribution' AND m.count > 0
    GROUP BY day, os_version, key
)
SELECT d.day AS day, d.os_version AS os_version, d.key AS key, count() AS devices,
       sum(d.count) AS count, any(means.middle) AS mean,
       sum(ifNull(d.m2, 0) + d.count * pow(ifNull(d.mean, 0) - means.middle, 2)) AS m2,
       min(ifNull(d.min, 0)) AS min, max(ifNull(d.max, 0)) AS max
FROM metrics AS d FINAL
INNER JOIN means ON means.day = d.day AND means.os_version = d.os_version AND means.key = d.key
WHERE d.kind = 'distribution' AND d.count > 0
GROUP BY day, os_version, key;

-- Bucket by bucket, since not every log has every bucket.
CREATE MATERIALIZED VIEW IF NOT EXISTS daily_histograms_refresh REFRESH EVERY 1 DAY
TO daily_histograms AS
SELECT day, os_version, key, bucket.1 AS lower, bucket.2 AS upper, sum(bucket.3) AS count
FROM
(
    SELECT day, os_version, key, arrayJoin(arrayZip(lower, upper, counts)) AS bucket
    FROM metrics FINAL
    WHERE kind = 'histogram'
)
GROUP BY day, os_version, key, lower, upper;
