#!/usr/bin/python3
"""Reads an exposition on stdin; prints every sample as the OpenMetrics parser
and as the classic Prometheus text parser read it, one per line:
"<parser> <family> <unit> <sample name> <labels as sorted JSON> <value>".
Exits 1 with the parser's message when either rejects the text."""
import json
import sys

from prometheus_client.openmetrics.parser import text_string_to_metric_families as openmetrics
from prometheus_client.parser import text_string_to_metric_families as classic

text = sys.stdin.read()
for name, parse in (("openmetrics", openmetrics), ("classic", classic)):
    try:
        for family in parse(text):
            for sample in family.samples:
                print(name, family.name, family.unit or "-", sample.name,
                      json.dumps(sample.labels, sort_keys=True), repr(float(sample.value)))
    except Exception as error:  # the parsers raise ValueError and others
        print(f"{name} rejects: {error}")
        sys.exit(1)
