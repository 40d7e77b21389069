"""Walks every item of a SEQUENCE of small records from Python, with this codec and with others that are installed. Arguments
and output are those of a program of Google Benchmark, as far as scripts/bench uses them.

asn1crypto's parser gives out one item with copies of its octets, pyasn1's decoder the whole tree.
"""
import argparse
import functools
import gc
import itertools
import json
import random
import re
import time

from veltra import der

try:
    from asn1crypto import parser
except ImportError:
    parser = None
try:
    from pyasn1.codec.der import decoder
except ImportError:
    decoder = None

ITEMS_OF_ENTRY = 4


@functools.cache
def sequence_of(entries):
    record = (der.INTEGER, b"\x40\0\0\0"), (der.IA5_STRING, b"key000"), (der.OCTET_STRING, bytes(14))
    entry = der.encode(der.SEQUENCE, b"".join(itertools.starmap(der.encode, record)))
    return bytes(der.encode(der.SEQUENCE, entry * entries))


def walk_veltra(data):
    return sum(1 for _ in der.walk(data))


def walk_asn1crypto(data):
    seen = place = 0
    while place < len(data):
        (_, is_constructed, _, _, content, _), place = parser._parse(data, len(data), place)
        seen += 1 + (walk_asn1crypto(content) if is_constructed else 0)
    return seen


def walk_pyasn1(data):
    sequence, _ = decoder.decode(data)
    return 1 + sum(1 + len(entry) for entry in sequence)


CONTENDERS = {"veltra": walk_veltra} | ({"asn1crypto": walk_asn1crypto} if parser else {}) | (
    {"pyasn1": walk_pyasn1} if decoder else {})


def cost_of(walk, entries):
    """Nanoseconds an item."""
    data, items = sequence_of(entries), 1 + ITEMS_OF_ENTRY * entries
    gc.collect()
    start = time.process_time_ns()
    for runs in itertools.count(1):
        if walk(data) != items:
            raise SystemExit("der_bench: the walk went wrong")
        if (taken := time.process_time_ns() - start) > 50_000_000:
            return taken / runs / items


def main():
    arguments = argparse.ArgumentParser()
    arguments.add_argument("--benchmark_filter", default="")
    arguments.add_argument("--benchmark_repetitions", type=int, default=1)
    given, _ = arguments.parse_known_args()
    runs = [(f"walk-python/{name}/{entries}", walk, entries)
            for entries in (100, 1_000, 10_000) for name, walk in CONTENDERS.items()]
    runs = [run for run in runs if re.search(given.benchmark_filter, run[0])]
    found = []
    for _ in range(given.benchmark_repetitions):
        for name, walk, entries in random.sample(runs, len(runs)):
            cost = cost_of(walk, entries)
            found.append({"run_type": "iteration", "run_name": name, "real_time": cost, "ns_per_item": cost})
    print(json.dumps({"benchmarks": found}))


main()
