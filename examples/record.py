"""Records over loopback UDP with Debian's python3-statsd: record.py PORT"""
import sys

import statsd

client = statsd.StatsClient("127.0.0.1", int(sys.argv[1]))
for _ in range(4):
    client.incr("example.python.runs")
client.incr("example.python.bytes", 1500)
client.decr("example.python.bytes", 500)
client.gauge("example.python.level", -5)  # sent as "set to 0", then "5 less"
with client.pipeline() as pipeline:
    for milliseconds in (10, 20, 30, 40, 50):
        pipeline.timing("example.python.time", milliseconds)
