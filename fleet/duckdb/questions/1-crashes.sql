-- Crashes per 1,000 launches, by OS version.
SELECT os_version,
       1000 * sum(number) FILTER (key = 'example.crashes')
            / sum(number) FILTER (key = 'example.launches') AS crashes
FROM metrics
WHERE kind = 'scalar' AND key IN ('example.crashes', 'example.launches')
GROUP BY os_version
ORDER BY os_version;
