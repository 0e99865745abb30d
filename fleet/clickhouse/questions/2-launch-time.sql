-- The pooled launch time and its spread, in milliseconds, by OS version.
WITH means AS
(
    SELECT os_version, sum(d.count * d.mean) / sum(d.count) AS middle
    FROM daily_distributions AS d
    WHERE key = 'example.launch.ms'
    GROUP BY os_version
)
SELECT d.os_version AS os_version, sum(d.count) AS launches, any(means.middle) AS mean,
       sqrt(sum(d.m2 + d.count * pow(d.mean - means.middle, 2)) / (sum(d.count) - 1)) AS deviation
FROM daily_distributions AS d
INNER JOIN means ON means.os_version = d.os_version
WHERE d.key = 'example.launch.ms'
GROUP BY os_version
ORDER BY os_version;
