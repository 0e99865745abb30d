-- Crashes per 1,000 launches, by OS version.
SELECT os_version,
       1000 * sumIf(total, key = 'example.crashes') / sumIf(total, key = 'example.launches') AS crashes
FROM daily_scalars
WHERE key IN ('example.crashes', 'example.launches')
GROUP BY os_version
ORDER BY os_version;
