// Records over the Unix socket with hot-shots (and its unix-dgram): node record.js SOCKET
const StatsD = require('hot-shots');

const client = new StatsD({
  protocol: 'uds',
  path: process.argv[2],
  errorHandler: (error) => {
    console.error(error.message);
    process.exitCode = 1;
  },
});
for (let i = 0; i < 3; ++i) client.increment('example.node.runs');
client.gauge('example.node.level', 42);
[1, 2, 3, 4, 5.5].forEach((value) => client.timing('example.node.time', value));
client.histogram('example.node.size', 7, { route: 'tags are left out' });
client.close(() => {});
