-- {file} holds rows of `quorletctl logs export`. Types are named: a number that is guessed to be a
-- double loses the low digits of large integers.
INSERT INTO metrics
SELECT key, toDate(row.day), device, kind, parseDateTimeBestEffort(created), os_version, log,
       whitelist, tasking, unit, toInt64OrNull(value), toFloat64OrNull(value),
       if(number IS NULL, value, '') AS text, min, max, mean, m2, count, lower, upper, counts
FROM
(
    SELECT *, toFloat64OrNull(value) AS number
    FROM file('{file}', 'JSONEachRow',
              'device String, day String, created String, os_version String, log String,
               whitelist String, tasking String, kind String, key String, unit String,
               value String, min Nullable(Float64), max Nullable(Float64),
               mean Nullable(Float64), m2 Nullable(Float64), count UInt64,
               lower Array(Nullable(Float64)), upper Array(Nullable(Float64)),
               counts Array(UInt64)')
) AS row
SETTINGS input_format_json_read_numbers_as_strings = 1;
