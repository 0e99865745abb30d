"""Writes logs with every shape that an export has to turn into OTLP. usage: sample_logs.py DIR"""
import os
import plistlib
import sys
from datetime import datetime

INF, NAN = float("inf"), float("nan")
DOCUMENT = {
    "TLStartDate": datetime(2026, 3, 4),
    "TLScalars": {"big": 2**63 - 1, "small": -(2**63), "above": 2**64 - 1, "half": 0.5,
                  "nothing": NAN, "nuvex.kernel.swapusage": 1 << 40, "k\u00e9y \"\\": 1},
    "TLDistributions": {
        "plain": [1.0, 50.0, 20.5, 800.0, 4], "negative": [-3.0, 5.0, 1.0, 2.0, 3],
        "infinite": [-INF, INF, NAN, NAN, 2], "empty": [0.0, 0.0, 0.0, 0.0, 0],
        "gaps": [1.0, 90.0, 30.0, 9.0, 3], "overlap": [1.0, 9.0, 3.0, 9.0, 3],
        "saturated": [1.0, 9.0, 3.0, 9.0, 2**31 - 1], "whole": [1.0, 9.0, 3.0, 9.0, 3]},
    "TLDistributionsHistogram": {
        "plain": {"(-inf, 20]": 1, "(20, 40]": 2, "(40, inf)": 1},
        "gaps": {"(5, 10]": 1, "(20, 40]": 2}, "overlap": {"(0, 10]": 1, "(5, 20]": 2},
        "saturated": {"(-inf, 5]": 2**31, "(5, inf)": 1}, "whole": {"(-inf, inf)": 3},
        "alone": {"(0.1, 1e+22]": 7}}}
STATUS = ("System ID: x\nDate: y\n\n2026-03-04 05:06:07 +0000 quorlet[7]: "
          "UserWamp:2.24;ValidityList[0]:3;ValidityList[1]:3,5;nuvex.NANDInfo.NumLogicalReads:-1\n")


def main():
    outbox = os.path.join(sys.argv[1], "sample device", "outbox")
    os.makedirs(outbox)
    body = plistlib.dumps(DOCUMENT).decode()
    header = '{"type":"%s","created":"2026-03-05T00:00:01Z","os_version":"Demo 1 (1)"}\n'
    for kind, text in (("193", body), ("165", STATUS)):
        with open(os.path.join(outbox, kind + ".log"), "w", encoding="utf-8") as file:
            file.write(header % kind + text)


main()
