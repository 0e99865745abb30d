-- Devices that miss days of the period, most first.
WITH (SELECT dateDiff('day', min(day), max(day)) + 1 FROM metrics WHERE log = '193') AS period
SELECT device, period - uniqExact(day) AS missing
FROM metrics
WHERE key = 'example.launches' AND log = '193'
GROUP BY device
HAVING missing > 0
ORDER BY missing DESC, device
LIMIT 20;
