#!/usr/bin/env bash
# bench.sh [--short] [BUILD_DIR]: builds the read-path benchmarks in a Release tree (default
# build-bench), runs them and prints a Markdown table of each figure against its floor, measured in
# the same run. --short gives each benchmark a minimal run (CI: checks that they work; ratios of a
# single iteration are rough). Exits non-zero when the build or a benchmark fails, not when a goal
# is missed (the table says "not met"). JOBS sets the build's parallelism (default 2). The sandbox
# roots go to $TMPDIR (default /tmp): fsync costs what that file system makes it cost.
set -euo pipefail
cd "$(dirname "$0")/.."

short=0
if [ "${1:-}" = "--short" ]; then
  short=1
  shift
fi
build=${1:-build-bench}

./scripts/install-deps.sh
cmake -S . -B "$build" -DCMAKE_BUILD_TYPE=Release -DFILEINDEX_BUILD_TESTS=ON \
  -DFILEINDEX_BUILD_BENCH=ON >/dev/null
cmake --build "$build" -j"${JOBS:-2}" --target read_paths_bench >/dev/null

args=(--benchmark_format=json)
if [ "$short" = 1 ]; then
  args+=(--benchmark_min_time=0.01)
fi
json=$(mktemp)
trap 'rm -f "$json"' EXIT
status=0
"$build/bench/read_paths_bench" "${args[@]}" >"$json" || status=$?

# df names the file system as mounted (stat -f cannot tell ext4 from ext2).
sandbox_fs=$(df --output=fstype "${TMPDIR:-/tmp}" | tail -n 1)
python3 - "$json" "$status" "$sandbox_fs" <<'PYTHON'
import json
import sys

path, status, sandbox_fs = sys.argv[1], int(sys.argv[2]), sys.argv[3]
try:
    with open(path) as f:
        run = json.load(f)
except (OSError, ValueError) as error:
    print(f"bench.sh: no results from the benchmark (exit status {status}): {error}",
          file=sys.stderr)
    sys.exit(1)


def show(value, unit):
    if unit == "us":  # microseconds, shown in the largest unit that keeps a leading digit
        for scale, name in ((1e6, "s"), (1e3, "ms")):
            if value >= scale:
                return f"{value / scale:.3g} {name}"
        return f"{value:.3g} µs"
    return f"{value:.3g} {unit}"


context = run.get("context", {})
print(f"Host: {context.get('num_cpus', '?')} CPUs at {context.get('mhz_per_cpu', '?')} MHz, "
      f"load {', '.join(f'{x:.2f}' for x in context.get('load_avg', []))}; "
      f"sandbox on {sandbox_fs}; {context.get('date', '')}")
print()
print("| Figure | Measured | Floor | Ratio | Goal | Met |")
print("|---|---|---|---|---|---|")
failures = []
for bench in run.get("benchmarks", []):
    if bench.get("error_occurred"):
        failures.append(f"{bench['name']}: {bench.get('error_message', 'failed')}")
        continue
    label = bench.get("label", "")
    if "|" not in label:
        continue
    figure, unit = label.rsplit("|", 1)
    measured, floor = bench.get("measured", 0.0), bench.get("floor", 0.0)
    ratio, goal = bench.get("ratio", 0.0), bench.get("goal", 0.0)
    floor_text = show(floor, unit) if floor > 0 else "—"
    ratio_text = (f"{ratio:,.0f}×" if ratio >= 100 else f"{ratio:.3g}×") if floor > 0 else "—"
    goal_text = f"≤ {goal:g}×" if goal > 0 else "—"
    met = ("yes" if ratio <= goal else "not met") if goal > 0 else "(reported)"
    print(f"| {figure} | {show(measured, unit)} | {floor_text} | {ratio_text} | {goal_text} | {met} |")
for failure in failures:
    print(f"bench.sh: {failure}", file=sys.stderr)
sys.exit(1 if failures or status != 0 else 0)
PYTHON
