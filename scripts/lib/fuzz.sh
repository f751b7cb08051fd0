#!/usr/bin/env bash
# Runs every fuzz target from its kept seeds, sharing that many seconds evenly.
# fuzz.sh DIRECTORY-OF-TARGETS SECONDS
set -euo pipefail
bin=$1
seconds=$2
cd "$(dirname "$0")/../.."

mapfile -t targets < <(find tests/fuzz/seeds -mindepth 1 -maxdepth 1 -type d -printf '%f\n' | sort)
[ ${#targets[@]} -gt 0 ] || { echo "fuzz: no targets" >&2; exit 1; }
each=$((seconds / ${#targets[@]}))
scratch=$(mktemp -d)
trap 'rm -rf "$scratch"' EXIT
for target in "${targets[@]}"; do
  echo "fuzz: $target for $each s"
  mkdir -p "$scratch/$target"
  if ! "$bin/$target" -max_total_time="$each" -timeout=10 -rss_limit_mb=1024 -artifact_prefix="$scratch/" \
    "$scratch/$target" "tests/fuzz/seeds/$target" >"$scratch/log" 2>&1; then
    tail -n 60 "$scratch/log"
    exit 1
  fi
  grep -E '^(stat::|Done|#[0-9]+.*DONE)' "$scratch/log" | tail -n 2
done
