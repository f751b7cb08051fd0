#!/usr/bin/env bash
# Runs every fuzz target from its seeds, two at a time. The targets share SECONDS of CPU
# time evenly.
# fuzz.sh DIRECTORY-OF-TARGETS SECONDS
set -euo pipefail
bin=$(realpath "$1")
seconds=$2
cd "$(dirname "$0")/../.."

mapfile -t targets < <(find tests/fuzz/seeds -mindepth 1 -maxdepth 1 -type d -printf '%f\n' | sort)
[ ${#targets[@]} -gt 0 ] || { echo "fuzz: no targets" >&2; exit 1; }
each=$((seconds / ${#targets[@]}))
scratch=$(mktemp -d)
trap 'rm -rf "$scratch"' EXIT

# How many edges of the control flow the inputs reached.
covered() { sed -n 's/.* cov: \([0-9]*\).*/\1/p' "$1" | tail -n 1; }

run_target() {
  local target=$1 found=$scratch/$1
  mkdir "$found"
  if ! "$bin/$target" -max_total_time="$each" -timeout=10 -rss_limit_mb=1024 \
    -artifact_prefix="$scratch/$target-" "$found" "tests/fuzz/seeds/$target" >"$found.log" 2>&1; then
    tail -n 60 "$found.log"
    return 1
  fi
  echo "fuzz: $target: $(grep -E '^Done' "$found.log"), $(covered "$found.log") edges of $(
    sed -n 's/.* modules\? *(\([0-9]*\) inline.*/\1/p' "$found.log" | head -n 1)"
}
export -f covered run_target
export bin each scratch
printf '%s\0' "${targets[@]}" | xargs -0 -n 1 -P 2 bash -c 'run_target "$1"' _
