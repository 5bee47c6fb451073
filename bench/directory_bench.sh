#!/usr/bin/env bash
# The directory section of the benchmarks: getVornConfig against a raw
# libldap read of the same record on one private slapd, with the ratios.
# scripts/bench runs it as its "directory" section:
#
#   section_directory() { bench/directory_bench.sh "$min_time"; }
#
#   bench/directory_bench.sh [MIN_TIME]   seconds per size (default 2)
set -euo pipefail
cd "$(dirname "$0")/.."

min_time=${1:-${KOLT_BENCH_MIN_TIME:-2}}
if [ ! -x build/directory_bench ]; then
  cmake --preset default >/dev/null
  cmake --build --preset default -j2 --target directory_bench >/dev/null
fi
echo "== directory: getVornConfig against raw libldap on a private slapd (wall clock) =="
# The per-size lines go to a log; the ratios table is what the section shows.
log=$(mktemp "${TMPDIR:-/tmp}/kolt-directory-bench.XXXXXX")
trap 'rm -f "$log"' EXIT
# The same glibc heap settings as the other sections: without them glibc may
# hand a freed 2 MB tree back to the kernel after each read, and the page
# faults that follow differ from run to run with the heap's layout.
GLIBC_TUNABLES=glibc.malloc.trim_threshold=268435456:glibc.malloc.mmap_threshold=33554432 \
  build/directory_bench --benchmark_min_time="$min_time" --benchmark_color=false >"$log" 2>&1 || {
  cat "$log" >&2
  exit 1
}
sed -n '/^getVornConfig/,$p' "$log"
