-- The drives that wear fastest, and the days until they are used up at this rate.
WITH (SELECT min(day) FROM metrics) AS start
SELECT device, key AS drive, last AS used, slope AS percent_a_day, (100 - last) / slope AS days_left
FROM
(
    SELECT device, key, argMax(assumeNotNull(number), day) AS last,
           simpleLinearRegression(toFloat64(dateDiff('day', start, day)),
                                  assumeNotNull(number)).1 AS slope
    FROM metrics FINAL
    WHERE key LIKE 'nuvex.flash.%.used' AND number IS NOT NULL
    GROUP BY device, key
    HAVING count() > 1
)
WHERE slope > 0 AND last < 100
ORDER BY days_left, device
LIMIT 20;
