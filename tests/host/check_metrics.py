# Reads a metrics file with the Prometheus client library's parser and prints
# one line per sample: name, type, value. Exit status 1 when the text does not
# parse, or a metric lacks its HELP or TYPE line.
import sys

from prometheus_client.parser import text_string_to_metric_families

with open(sys.argv[1], encoding="utf-8") as f:
    text = f.read()
try:
    families = list(text_string_to_metric_families(text))
except ValueError as error:
    print(f"parse error: {error}")
    sys.exit(1)
for family in families:
    if family.type == "unknown" or not family.documentation:
        print(f"{family.name}: no TYPE or HELP line")
        sys.exit(1)
    for sample in family.samples:
        print(sample.name, family.type, repr(sample.value))
