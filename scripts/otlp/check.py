"""Checks lines of OTLP/JSON on standard input: types, names, and the rules that types do not hold.

usage: check.py DIRECTORY_OF_METRICS_PB2
Prints how many requests and points it has read; the first fault ends it with status 1.
"""
import json
import math
import sys

sys.path.insert(0, sys.argv[1])
import metrics_pb2  # noqa: E402
from google.protobuf import json_format  # noqa: E402

# Fields that JSON writes as decimal strings.
STRINGS = {"asInt", "count", "timeUnixNano", "startTimeUnixNano", "intValue"}
DAY = 86_400_000_000_000


class Fault(Exception):
    pass


def expect(true, what):
    if not true:
        raise Fault(what)


def check_json(node, path=""):
    """64-bit integers are strings, and names are lowerCamelCase; parsers take more."""
    if isinstance(node, list):
        for element in node:
            check_json(element, path)
    elif isinstance(node, dict):
        for name, value in node.items():
            expect("_" not in name, f"{path}: the name {name}")
            if name in STRINGS:
                expect(isinstance(value, str), f"{path}.{name} is no string")
            if name == "bucketCounts":
                expect(all(isinstance(v, str) for v in value), f"{path}: bucketCounts")
            if name == "aggregationTemporality":
                expect(isinstance(value, int), f"{path}: an enumeration by name")
            check_json(value, f"{path}.{name}")


def check_histogram(name, histogram):
    expect(histogram.aggregation_temporality == 1, f"{name}: temporality")
    for point in histogram.data_points:
        bounds, counts = list(point.explicit_bounds), list(point.bucket_counts)
        expect(len(counts) == len(bounds) + 1 or not counts and not bounds, f"{name}: lengths")
        expect(not counts or sum(counts) == point.count, f"{name}: counts do not add up")
        expect(all(a < b for a, b in zip(bounds, bounds[1:])), f"{name}: bounds do not ascend")
        expect(all(map(math.isfinite, bounds)), f"{name}: a bound is not finite")
        expect(not (point.HasField("sum") and point.HasField("min") and point.min < 0),
               f"{name}: the sum of negative values")
        if point.count == 0:
            expect(point.sum == 0, f"{name}: a sum of nothing")
        keys = [attribute.key for attribute in point.attributes]
        expect(len(keys) == len(set(keys)), f"{name}: an attribute twice")
        yield point


def check_request(request):
    for resource in request.resource_metrics:
        names = {a.key: a.value.string_value for a in resource.resource.attributes}
        expect(names.get("service.name") == "quorlet", "service.name")
        for scope in resource.scope_metrics:
            for metric in scope.metrics:
                expect(metric.name != "", "a metric without a name")
                kind = metric.WhichOneof("data")
                expect(kind is not None, f"{metric.name}: no data")
                points = (list(check_histogram(metric.name, metric.histogram))
                          if kind == "histogram" else list(metric.gauge.data_points))
                expect(points, f"{metric.name}: no point")
                for point in points:
                    expect(point.time_unix_nano - point.start_time_unix_nano == DAY
                           and point.start_time_unix_nano % DAY == 0, f"{metric.name}: not a day")
                    if kind == "gauge":
                        expect(point.WhichOneof("value"), f"{metric.name}: no value")
                        expect(math.isfinite(point.as_double), f"{metric.name}: not finite")
                    yield point


def main():
    requests = points = 0
    for number, line in enumerate(sys.stdin, 1):
        try:
            check_json(json.loads(line))
            request = json_format.Parse(line, metrics_pb2.ExportMetricsServiceRequest())
            # The same message once more, through the wire format.
            again = metrics_pb2.ExportMetricsServiceRequest.FromString(request.SerializeToString())
            expect(again == request, "it changes on the wire")
            points += sum(1 for _ in check_request(request))
        except (Fault, ValueError, json_format.ParseError) as fault:
            sys.exit(f"line {number}: {fault}")
        requests += 1
    print(f"{requests} requests, {points} points")
    if points == 0:
        sys.exit("nothing was checked")


main()
