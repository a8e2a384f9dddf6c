#!/usr/bin/env bash
# Prints how long tools/qor-emu takes from launch to "qor-emu: ready" (bus, qor-devsim and the
# daemon up and logging). Usage: bench-emu-ready.sh [RUNS] ; QOR_BUILD_DIR picks the executables.
set -euo pipefail
top=$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)
runs=${1:-5}
times=()
for ((i = 1; i <= runs; i++)); do
	root=$(mktemp -d /tmp/qor-bench.XXXXXX)
	start=$(date +%s%N)
	"$top/tools/qor-emu" --root "$root" --time-scale 0.01 >"$root/emu.out" 2>"$root/emu.err" &
	pid=$!
	deadline=$((SECONDS + 60))
	until grep -q '^qor-emu: ready' "$root/emu.out"; do
		if ! kill -0 "$pid" 2>/dev/null || [ $SECONDS -ge $deadline ]; then
			echo "run $i: qor-emu did not get ready" >&2
			cat "$root/emu.err" >&2
			kill -TERM "$pid" 2>/dev/null || true
			wait "$pid" || true
			exit 1
		fi
		sleep 0.005
	done
	end=$(date +%s%N)
	times+=($(((end - start) / 1000000)))
	kill -TERM "$pid"
	wait "$pid" || true
	grep -q " $root/" /proc/self/mountinfo || rm -rf "$root" # never through a mount
done
sorted=$(printf '%s\n' "${times[@]}" | sort -n)
min=$(echo "$sorted" | head -n 1)
max=$(echo "$sorted" | tail -n 1)
median=$(echo "$sorted" | sed -n "$(((runs + 1) / 2))p")
echo "qor-emu ready time over $runs runs: min ${min} ms, median ${median} ms, max ${max} ms (runs: ${times[*]})"
