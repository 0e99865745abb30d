-- The same on a cluster named {cluster}: each shard keeps the days of its devices, on each of its
-- replicas, and `metrics_everywhere` asks them all. A device's rows meet on one shard, so that they
-- replace each other there.
CREATE TABLE IF NOT EXISTS metrics ON CLUSTER '{cluster}'
(
{columns}
)
ENGINE = ReplicatedReplacingMergeTree('/clickhouse/tables/{shard}/metrics', '{replica}', created)
PARTITION BY toYYYYMM(day)
ORDER BY (key, day, device, kind)
TTL day + INTERVAL 400 DAY;

CREATE TABLE IF NOT EXISTS metrics_everywhere ON CLUSTER '{cluster}' AS metrics
ENGINE = Distributed('{cluster}', currentDatabase(), 'metrics', cityHash64(device));
