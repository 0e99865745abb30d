// Loads rows into an engine, twice, and asks the five questions:
//   node ask.js clickhouse|duckdb ROWS.ndjson DIR
// Writes one JSON object: seconds, bytes and answers. The tables stay in DIR.
const fs = require('fs');
const path = require('path');

const [engine, rows, dir] = process.argv.slice(2);

// The statements of a file; `{name}` in it becomes the value.
function statements(file, values = {}) {
  const text = fs.readFileSync(path.join(__dirname, engine, file), 'utf8')
                   .replace(/\{(\w+)\}/g, (all, name) => values[name] ?? all);
  return text.split(/;\s*(?:\n|$)/).filter(one => one.replace(/^\s*--.*$/gm, '').trim() !== '');
}

async function clickhouse() {
  const {Session} = require('chdb');
  const session = new Session(dir);
  session.query('CREATE DATABASE IF NOT EXISTS fleet');
  session.query('USE fleet');
  const ask = sql => session.query(sql, 'JSONEachRow').trim().split('\n').filter(Boolean)
                         .map(line => JSON.parse(line));
  return {
    prepare() {
      for (const sql of statements('schema.sql')) session.query(sql);
      // The engine here is a single one: of the cluster's tables it can only read the text.
      const columns = statements('schema.sql')[0].match(/\(\n([\s\S]*?)\n\)\nENGINE/)[1];
      for (const sql of statements('cluster.sql', {cluster: 'fleet', columns})) {
        session.query('EXPLAIN AST ' + sql.replace(/^\s*--.*$/gm, '').trim());
      }
    },
    load: () => statements('load.sql', {file: rows}).forEach(sql => session.query(sql)),
    refresh() {
      for (const table of ['scalars', 'distributions', 'histograms']) {
        session.query(`SYSTEM REFRESH VIEW daily_${table}_refresh`);
        session.query(`SYSTEM WAIT VIEW daily_${table}_refresh`);
      }
    },
    ask,
    size: () => ask('OPTIMIZE TABLE metrics FINAL') &&
        ask(`SELECT toUInt32(sum(rows)) AS rows, toUInt32(sum(bytes_on_disk)) AS bytes
             FROM system.parts WHERE active AND database = 'fleet' AND table = 'metrics'`)[0],
  };
}

async function duckdb() {
  const {DuckDBInstance} = require('@duckdb/node-api');
  const file = path.join(dir, 'fleet.duckdb');
  const connection = await (await DuckDBInstance.create(file)).connect();
  const run = sql => connection.run(sql);
  const ask = async sql => (await connection.runAndReadAll(sql)).getRowObjectsJson();
  return {
    prepare() {},
    async load() { for (const sql of statements('load.sql', {file: rows})) await run(sql); },
    refresh() {},
    ask,
    async size() {
      await run('CHECKPOINT');
      const [{rows: count}] = await ask('SELECT count(*)::INTEGER AS rows FROM metrics');
      return {rows: count, bytes: fs.statSync(file).size};
    },
  };
}

async function timed(work) {
  const start = process.hrtime.bigint();
  const value = await work();
  return [value, Number(process.hrtime.bigint() - start) / 1e9];
}

async function main() {
  fs.mkdirSync(dir, {recursive: true});
  const tables = await {clickhouse, duckdb}[engine]();
  await tables.prepare();
  const [, load] = await timed(() => tables.load());
  await tables.load();  // must change nothing
  const [, refresh] = await timed(() => tables.refresh());
  const questions = {};
  for (const file of fs.readdirSync(path.join(__dirname, engine, 'questions')).sort()) {
    const [sql] = statements(path.join('questions', file));
    const [answer, seconds] = await timed(() => tables.ask(sql));
    questions[path.basename(file, '.sql')] = {seconds, answer};
  }
  const {rows: count, bytes} = await tables.size();
  const peak = Number(fs.readFileSync('/proc/self/status', 'utf8').match(/VmHWM:\s+(\d+)/)[1]);
  console.log(JSON.stringify({engine, load, refresh, rows: count, bytes, peak_kib: peak, questions}));
  process.exit(0);
}

main().catch(error => {
  console.error(`fleet/ask.js: ${engine}: ${error.message}`);
  process.exit(1);
});
