#!/usr/bin/env bash
# Builds and tests the service without its optional parts: once without each, once without all.
# Each build is kept in build/without-<part>; only the first run takes long.
#
#   scripts/lib/optional-parts.sh            # each of them: the service, its unit tests, its start
#   scripts/lib/optional-parts.sh nats       # only the build without that part
#   scripts/lib/optional-parts.sh --quick    # without all: the service and its start, no unit tests
set -euo pipefail
cd "$(dirname "$0")/../.."

declare -A options=(
  [alsa]="-DHALVOX_ALSA=OFF"
  [pipewire]="-DHALVOX_PIPEWIRE=OFF"
  [trace-points]="-DHALVOX_WITH_LTTNG=OFF"
  [tracing]="-DHALVOX_TRACING=OFF"
  [nats]="-DHALVOX_NATS=OFF"
  [report]="-DHALVOX_REPORT=OFF"
  [screen]="-DHALVOX_SCREEN=OFF"
  [man]="-DHALVOX_MAN=OFF"
)
options[all]="${options[*]}"

# check <part> <targets to build>
check() {
  local part=$1 tree=build/without-$1
  shift
  echo "optional-parts: building without $part in $tree"
  # shellcheck disable=SC2086  # several options
  cmake --preset dev -B "$tree" -DHALVOX_UNITY=ON ${options[$part]} >/dev/null
  cmake --build "$tree" --target "$@" >"$tree/build.log" || { tail -n 50 "$tree/build.log"; return 1; }
  echo "optional-parts: starting the service without $part"
  (cd tests/system && HALVOX_BIN="$PWD/../../$tree/bin" PYTHONDONTWRITEBYTECODE=1 \
    /usr/bin/python3 -m unittest -v test_modules)
}

# test_units <part>
test_units() {
  echo "optional-parts: unit tests without $1"
  ctest --test-dir "build/without-$1" -L unit --output-on-failure --no-tests=error
}

case "${1:-}" in
  --quick)
    check all halvox-reportingd halvox-sqlite halvoxctl
    ;;
  "")
    for part in alsa pipewire trace-points tracing nats report screen man all; do
      check "$part" all
      test_units "$part"
    done
    ;;
  *)
    [ -n "${options[$1]:-}" ] || { echo "optional-parts: there is no part $1" >&2; exit 2; }
    check "$1" all
    test_units "$1"
    ;;
esac
echo "optional-parts: passed"
