#!/usr/bin/env bash
# Builds the benchmarks (preset "bench"), runs them REPETITIONS times (default 5, randomly
# interleaved) and prints each operation's median with its ratio to the baselines of the same
# run. Extra arguments go to the benchmark program (e.g. --benchmark_filter=Write).
set -euo pipefail
cd "$(dirname "$0")/.."
REPETITIONS=${REPETITIONS:-5}
launcher=()
if command -v ccache >/dev/null; then
  launcher=(-DCMAKE_C_COMPILER_LAUNCHER=ccache -DCMAKE_CXX_COMPILER_LAUNCHER=ccache)
fi
cmake --preset bench "${launcher[@]}" >&2
cmake --build --preset bench --target lbpmx_bench >&2
json=$(mktemp)
trap 'rm -f "$json"' EXIT
build/bench/bin/lbpmx_bench --benchmark_repetitions="$REPETITIONS" --benchmark_enable_random_interleaving=true \
  --benchmark_min_time=0.5 --benchmark_out="$json" --benchmark_out_format=json "$@" >/dev/null
python3 - "$json" "$REPETITIONS" <<'PY'
import json, statistics, sys
data = json.load(open(sys.argv[1]))
runs = {}
for b in data["benchmarks"]:
    if b.get("run_type") != "iteration" or b.get("error_occurred"):
        continue
    scale = {"ns": 1e-3, "us": 1.0, "ms": 1e3, "s": 1e6}[b["time_unit"]]
    r = runs.setdefault(b["run_name"], {"us": [], "allocs": [], "switches": [], "ips": []})
    r["us"].append(b["real_time"] * scale)
    if "allocs" in b: r["allocs"].append(b["allocs"])
    if "switches" in b: r["switches"].append(b["switches"])
    if "items_per_second" in b: r["ips"].append(b["items_per_second"])
def med(name, key):
    values = runs.get(name, {}).get(key, [])
    return statistics.median(values) if values else None
ring = med("BM_Ring/real_time", "us")
pingpong = med("BM_SemaphorePingPong/real_time", "us")
def scaling(prefix):
    one, four = med(prefix + "/real_time/threads:1", "ips"), med(prefix + "/real_time/threads:4", "ips")
    return four / one if one and four else None
rows = [
    ("semaphore ping-pong (baseline)", "BM_SemaphorePingPong/real_time", None),
    ("three-thread ring (baseline)", "BM_Ring/real_time", None),
    ("thread start + join (baseline)", "BM_ThreadStartJoin/real_time", None),
    ("acknowledged write", "BM_AcknowledgedWrite/real_time", ("ratio", 1.2, "allocs", 8)),
    ("*IDN? query", "BM_IdnQuery/real_time", ("ratio", 1.35)),
    ("trigger + FETCh? + read", "BM_TriggerFetchRead/real_time", ("ratio", 1.6)),
    ("1024-point binary trace", "BM_Trace1024/real_time", None),
    ("viReadSTB", "BM_ReadSTB/real_time", ("us", 0.3, "allocs", 0)),
    ("open a sensor session", "BM_OpenSession/real_time", ("us", 60)),
    ("cycle with SRQ handler", "BM_SrqCycle/real_time", None),
]
print("%s run(s), medians; ratio = operation / three-thread ring of the same run" % sys.argv[2])
print("| operation | median µs | × ring | allocs/op | switches/op | target | met |")
print("|---|---:|---:|---:|---:|---|---|")
def fmt(v, f="%.2f"):
    return "–" if v is None else f % v
for label, name, target in rows:
    us, allocs, switches = med(name, "us"), med(name, "allocs"), med(name, "switches")
    ratio = us / ring if us is not None and ring else None
    goal, met = "", ""
    if target:
        checks = []
        for kind, limit in zip(target[0::2], target[1::2]):
            value = {"ratio": ratio, "us": us, "allocs": allocs}[kind]
            goal_text = {"ratio": "≤ %s × ring", "us": "≤ %s µs", "allocs": "≤ %s allocs"}[kind] % limit
            checks.append((goal_text, value is not None and value <= limit + 1e-9))
        goal = ", ".join(c[0] for c in checks)
        measured = all({"ratio": ratio, "us": us, "allocs": allocs}[k] is not None for k in target[0::2])
        met = "–" if not measured else "yes" if all(c[1] for c in checks) else "no"
    print("| %s | %s | %s | %s | %s | %s | %s |"
          % (label, fmt(us), fmt(ratio), fmt(allocs, "%.1f"), fmt(switches, "%.1f"), goal, met))
threads, pairs = scaling("BM_WritesOnSensors"), scaling("BM_SemaphorePairs")
print("| 4 threads on 4 sensors vs 1 (throughput) | | %s | | | ≥ 1.8 × one thread | %s |"
      % (fmt(threads), "–" if threads is None else ("yes" if threads >= 1.8 else "no")))
print("| 4 semaphore pairs vs 1 (baseline) | | %s | | | | |" % fmt(pairs))
PY
