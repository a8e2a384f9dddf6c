#!/usr/bin/env bash
# Prints the idle cost of the daemon on the emulated phone with the real 30-second polling period:
# wakeups (voluntary + involuntary context switches of all its threads), CPU time and resident
# memory over a measured span. Usage: bench-vorn-idle.sh [SECONDS] ; QOR_BUILD_DIR picks the executables.
set -euo pipefail
top=$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)
span=${1:-120}
settle=5 # past start-up and the immediate first cycle
root=$(mktemp -d /tmp/qor-idle.XXXXXX)
"$top/tools/qor-emu" --root "$root" --time-scale 1 >"$root/emu.out" 2>"$root/emu.err" &
emu=$!
stop() {
	kill -TERM "$emu" 2>/dev/null || true
	wait "$emu" || true
	grep -q " $root/" /proc/self/mountinfo || rm -rf "$root" # never through a mount
}
trap stop EXIT

deadline=$((SECONDS + 60))
until grep -q '^qor-emu: ready' "$root/emu.out"; do
	if ! kill -0 "$emu" 2>/dev/null || [ $SECONDS -ge $deadline ]; then
		echo "qor-emu did not get ready" >&2
		cat "$root/emu.err" >&2
		exit 1
	fi
	sleep 0.05
done
pid=$(cat "$root/qor-server.pid")

switches() { # voluntary + involuntary, summed over the threads
	local total=0 v
	for v in $(cat /proc/"$pid"/task/*/status | awk '/^(non)?voluntary_ctxt_switches:/ { print $2 }'); do
		total=$((total + v))
	done
	echo "$total"
}
cpu_ticks() { # utime + stime of the process (all threads)
	local stat
	stat=$(cat /proc/"$pid"/stat)
	stat=${stat##*) }
	awk '{ print $12 + $13 }' <<<"$stat"
}
rss() { awk '/^VmRSS:/ { print $2 }' /proc/"$pid"/status; }

sleep "$settle"
sw0=$(switches) cpu0=$(cpu_ticks) rss0=$(rss)
lines0=$(grep -c '/dev/kmsg \[thermal\] \[' "$root/journal" || true)
sleep "$span"
sw1=$(switches) cpu1=$(cpu_ticks) rss1=$(rss)
lines1=$(grep -c '/dev/kmsg \[thermal\] \[' "$root/journal" || true)
hz=$(getconf CLK_TCK)

echo "idle span:           ${span} s (time scale 1, polling every 30 s)"
echo "threads:             $(ls /proc/"$pid"/task | wc -l)"
echo "status lines:        $((lines1 - lines0))"
echo "wakeups:             $((sw1 - sw0)) context switches ($(awk -v n=$((sw1 - sw0)) -v s="$span" 'BEGIN { printf "%.2f", n / s }') per s)"
echo "cpu time:            $(awk -v t=$((cpu1 - cpu0)) -v hz="$hz" 'BEGIN { printf "%.3f", t / hz }') s (utime+stime)"
echo "VmRSS:               ${rss0} kB -> ${rss1} kB"
