-- The drives that wear fastest, and the days until they are used up at this rate.
WITH start AS (SELECT min(day) AS first FROM metrics),
drives AS
(
    SELECT device, key, arg_max(number, day) AS last, regr_slope(number, day - first) AS slope
    FROM metrics, start
    WHERE key LIKE 'nuvex.flash.%.used' AND number IS NOT NULL
    GROUP BY device, key
    HAVING count(*) > 1
)
SELECT device, key AS drive, last AS used, slope AS percent_a_day, (100 - last) / slope AS days_left
FROM drives
WHERE slope > 0 AND last < 100
ORDER BY days_left, device
LIMIT 20;
