-- Which whitelists and taskings are in the field, and on how many devices last.
WITH latest AS
(
    SELECT device, arg_max(whitelist, day) AS whitelist,
           arg_max(coalesce(tasking, ''), day) AS tasking
    FROM metrics
    WHERE key = 'example.launches'
    GROUP BY device
)
SELECT whitelist, tasking, count(*) AS devices
FROM latest
GROUP BY whitelist, tasking
ORDER BY devices DESC, whitelist, tasking;
