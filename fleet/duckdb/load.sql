-- {file} holds rows of `quorletctl logs export`. Types are named: guessing takes a column with one
-- fraction for doubles, which lose the low digits of large integers.
CREATE OR REPLACE TABLE metrics AS
SELECT * EXCLUDE (value), try_cast(value AS BIGINT) AS integer, try_cast(value AS DOUBLE) AS number
FROM read_json('{file}', format = 'newline_delimited',
               columns = {device: 'VARCHAR', day: 'DATE', created: 'TIMESTAMP',
                          os_version: 'VARCHAR', log: 'VARCHAR', whitelist: 'VARCHAR',
                          tasking: 'VARCHAR', kind: 'VARCHAR', key: 'VARCHAR', unit: 'VARCHAR',
                          value: 'VARCHAR', min: 'DOUBLE', max: 'DOUBLE', mean: 'DOUBLE',
                          m2: 'DOUBLE', count: 'UBIGINT', lower: 'DOUBLE[]', upper: 'DOUBLE[]',
                          counts: 'UBIGINT[]'})
QUALIFY row_number() OVER (PARTITION BY key, day, device, kind ORDER BY created DESC) = 1;
