-- Which whitelists and taskings are in the field, and on how many devices last.
SELECT whitelist, tasking, count() AS devices
FROM
(
    SELECT device, argMax(whitelist, day) AS whitelist, argMax(tasking, day) AS tasking
    FROM metrics FINAL
    WHERE key = 'example.launches'
    GROUP BY device
)
GROUP BY whitelist, tasking
ORDER BY devices DESC, whitelist, tasking;
