-- Devices that miss days of the period, most first.
WITH period AS (SELECT max(day) - min(day) + 1 AS days FROM metrics WHERE log = '193')
SELECT device, any_value(days) - count(DISTINCT day) AS missing
FROM metrics, period
WHERE key = 'example.launches' AND log = '193'
GROUP BY device
HAVING missing > 0
ORDER BY missing DESC, device
LIMIT 20;
