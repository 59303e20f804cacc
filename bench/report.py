#!/usr/bin/env python3
"""Renders tav-ipmi-bench's JSON output as the tables of bench/README.md.

Usage: report.py BENCH.json README.md [PEERS.md]

Each table replaces the text between its pair of markers in README.md
(<!-- NAME:begin --> and <!-- NAME:end -->); PEERS.md, bench/peers.sh's
output, goes between the peers markers.
"""

import json
import re
import sys


def load(path):
    with open(path) as f:
        data = json.load(f)
    runs = {}
    for b in data["benchmarks"]:
        # Repeated runs: the median of each figure, whatever one run met.
        if b.get("run_type") == "aggregate" and b.get("aggregate_name") != "median":
            continue
        # BM_Name/args/iterations:N[_median] -> BM_Name/args
        name = re.sub(r"/(iterations|real_time|min_time)[^/]*", "", b.get("run_name", b["name"]))
        if b.get("run_type") == "aggregate" or name not in runs:
            runs[name] = b
    return data["context"], runs


def num(value, digits=2):
    if value is None:
        return "n/a"
    if abs(value) >= 100:
        return f"{value:,.0f}"
    return f"{value:.{digits}f}"


def goal(value, limit, below=True):
    if value is None:
        return "n/a"
    ok = value <= limit if below else value >= limit
    return "met" if ok else "**missed**"


def floor_table(runs):
    rows = [
        ("full refresh chain, default profile", "BM_RefreshChain/0"),
        ("full refresh chain, 1,000 records", "BM_RefreshChain/1000"),
        ("reading refresh, default profile", "BM_ReadingRefresh/0"),
        ("reading refresh, 1,000 records", "BM_ReadingRefresh/1000"),
        ("SEL load, 3,000 records", "BM_SelLoadAtStart"),
        ("direct SEL synchroniser, 3,000 records", "BM_SelSyncDeviceEventlog"),
        ("FRU discovery, largest real profile", "BM_FruDiscovery"),
        ("steady poll pass, default profile", "BM_PollPass/0/1"),
        ("steady poll pass, 1,000 records", "BM_PollPass/1000/1"),
        ("periodic poll pass, default profile", "BM_PollPass/0/8"),
        ("SEL record delivered, log of 100", "BM_SelRecordDelivered/100"),
        ("SEL record delivered, log of 3,000", "BM_SelRecordDelivered/3000"),
        ("control: the bare client against itself (the chain's requests, default profile)",
         "BM_BareAgainstItself/0"),
    ]
    out = [
        "| operation | exchanges | library wall (ms) | bare client wall (ms) | ratio (goal ≤ 1.01) "
        "| library CPU per exchange beyond bare (µs, goal < 2) | the same at 1 ms (µs) "
        "| library CPU per operation beyond bare (µs) | bare client CPU per exchange (µs) |",
        "|---|---:|---:|---:|---:|---:|---:|---:|---:|",
    ]
    for label, key in rows:
        r = runs.get(key)
        if r is None or "wall_ratio" not in r:
            out.append(f"| {label} | n/a | | | | | | | |")
            continue
        if "lib_wall_ms" not in r:  # the bare client against itself
            out.append(f"| {label} | {num(r['exchanges'], 0)} | | | {r['wall_ratio']:.3f} | | | | |")
            continue
        ratio = r["wall_ratio"]
        cpu = r["lib_cpu_us_per_exchange"]
        out.append(
            f"| {label} | {num(r['exchanges'], 0)} | {num(r['lib_wall_ms'])} | {num(r['bare_wall_ms'])} "
            f"| {ratio:.3f} ({goal(ratio, 1.01)}) | {cpu:.2f} ({goal(cpu, 2.0)}) "
            f"| {num(r['lib_cpu_us_per_exchange_at_latency'])} "
            f"| {num(r['lib_cpu_us_per_run'])} | {num(r['bare_cpu_us_per_exchange'])} |"
        )
    return "\n".join(out)


def operations_table(runs):
    out = ["| operation | figure | goal |", "|---|---|---|"]
    for key, label in (("BM_PollPass/0/1", "default profile"), ("BM_PollPass/1000/1", "1,000 records")):
        r = runs.get(key)
        if r:
            total = r["lib_cpu_us_per_run"] + r["bare_cpu_us_per_exchange"] * r["exchanges"]
            out.append(
                f"| steady poll pass that changes nothing, {label} | {total:.1f} µs CPU in all, "
                f"{r['lib_cpu_us_per_run']:.2f} µs of it the library's | < 50 µs ({goal(total, 50)}) |"
            )
    for key, label in (("BM_CachedSensorsWithReadings/0", "37 sensors"),
                       ("BM_CachedSensorsWithReadings/1000", "800 sensors")):
        r = runs.get(key)
        if r:
            unit = {"ns": 1e-3, "us": 1.0, "ms": 1e3}[r["time_unit"]]
            cpu = r["cpu_time"] * unit
            out.append(
                f"| `getSensors` with every sensor's cached reading and state, {label} | {cpu:.2f} µs CPU, "
                f"{num(r['exchanges'], 0)} exchanges | |"
            )
    for key, label in (("BM_SelRecordDelivered/100", "log of 100"), ("BM_SelRecordDelivered/3000", "log of 3,000")):
        r = runs.get(key)
        if r:
            out.append(
                f"| one SEL record delivered to a handler, {label} | {r['lib_cpu_us_per_run']:.1f} µs CPU beyond "
                f"the bare client's for its {num(r['exchanges'], 0)} exchanges | |"
            )
    return "\n".join(out)


def memory_table(runs):
    out = ["| held | bytes | goal |", "|---|---:|---|"]
    for key, label in (("BM_RefreshChain/0", "per sensor, default profile (with its records and entities)"),
                       ("BM_RefreshChain/1000", "per sensor, 1,000 records (with its records and entities)")):
        r = runs.get(key)
        if r:
            v = r["heap_bytes_per_sensor"]
            out.append(f"| {label} | {v:.0f} | < 2,048 ({goal(v, 2048)}) |")
    r = runs.get("BM_SelLoadAtStart")
    if r:
        v = r["heap_bytes_per_record_beyond_16"]
        out.append(f"| per SEL record, beyond its 16 bytes (3,000 records) | {v:.0f} | < 100 ({goal(v, 100)}) |")
    return "\n".join(out)


def scaling_table(runs):
    out = [
        "| records | chain exchanges | chain library CPU (ms) | per record (µs) | heap per sensor (bytes) "
        "| SEL load exchanges | SEL library CPU (ms) | per record (µs) | heap per SEL record beyond 16 (bytes) |",
        "|---:|---:|---:|---:|---:|---:|---:|---:|---:|",
    ]
    for n in (100, 1000, 4000):
        c = runs.get(f"BM_RefreshChainScaling/{n}", {})
        s = runs.get(f"BM_SelLoadScaling/{n}", {})
        chain_ms = c.get("lib_cpu_ms_per_run")
        sel_ms = s.get("lib_cpu_ms_per_run")
        out.append(
            f"| {n:,} | {num(c.get('exchanges'), 0)} | {num(chain_ms)} "
            f"| {num(chain_ms * 1000 / n if chain_ms is not None else None)} | {num(c.get('heap_bytes_per_sensor'), 0)} "
            f"| {num(s.get('exchanges'), 0)} | {num(sel_ms)} "
            f"| {num(sel_ms * 1000 / n if sel_ms is not None else None)} "
            f"| {num(s.get('heap_bytes_per_record_beyond_16'), 0)} |"
        )
    return "\n".join(out)


def machine(context):
    load = ", ".join(f"{v:.2f}" for v in context.get("load_avg", []))
    return (f"Measured {context.get('date', '')} on {context.get('num_cpus')} CPUs at "
            f"{context.get('mhz_per_cpu')} MHz, load average {load}.")


def replace(text, name, body):
    pattern = re.compile(rf"(<!-- {name}:begin -->\n).*?(<!-- {name}:end -->)", re.S)
    if not pattern.search(text):
        sys.exit(f"report.py: README has no {name} markers")
    return pattern.sub(lambda m: m.group(1) + body.rstrip("\n") + "\n" + m.group(2), text)


def main():
    if len(sys.argv) not in (3, 4):
        sys.exit(__doc__)
    context, runs = load(sys.argv[1])
    with open(sys.argv[2]) as f:
        text = f.read()
    text = replace(text, "machine", machine(context))
    text = replace(text, "floor", floor_table(runs))
    text = replace(text, "operations", operations_table(runs))
    text = replace(text, "memory", memory_table(runs))
    text = replace(text, "scaling", scaling_table(runs))
    if len(sys.argv) == 4:
        with open(sys.argv[3]) as f:
            text = replace(text, "peers", f.read())
    with open(sys.argv[2], "w") as f:
        f.write(text)


if __name__ == "__main__":
    main()
