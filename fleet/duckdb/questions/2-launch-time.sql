-- The pooled launch time and its spread, in milliseconds, by OS version.
WITH launches AS
(
    SELECT os_version, count AS n, mean, m2 FROM metrics
    WHERE kind = 'distribution' AND key = 'example.launch.ms' AND count > 0
),
means AS
(
    SELECT os_version, sum(n * mean) / sum(n) AS middle FROM launches GROUP BY os_version
)
SELECT os_version, sum(n)::BIGINT AS launches, any_value(middle) AS mean,
       sqrt(sum(m2 + n * (mean - middle) ** 2) / (sum(n) - 1)) AS deviation
FROM launches JOIN means USING (os_version)
GROUP BY os_version
ORDER BY os_version;
