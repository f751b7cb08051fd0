#!/usr/bin/env bash
# Installs those of the given Debian packages that are missing, and prints their names:
# install-packages.sh SCRIPT PACKAGE... Does nothing if all are installed. The lines that it prints
# begin with the name of the script.
set -euo pipefail
if (($# < 2)); then
  echo "usage: install-packages.sh SCRIPT PACKAGE..." >&2
  exit 2
fi
script=$1
shift
packages=("$@")

missing=()
for package in "${packages[@]}"; do
  # shellcheck disable=SC2016  # the format is for dpkg-query
  state=$(dpkg-query --show --showformat='${db:Status-Status}' "$package" 2>/dev/null || true)
  [ "$state" = installed ] || missing+=("$package")
done

if [ ${#missing[@]} -eq 0 ]; then
  echo "$script: all ${#packages[@]} packages are installed"
  exit 0
fi

echo "$script: installing ${#missing[@]} of ${#packages[@]} packages: ${missing[*]}"
as_root=()
if [ "$(id -u)" -ne 0 ]; then
  as_root=(sudo)
fi
log=$(mktemp)
trap 'rm -f "$log"' EXIT
run_apt() {
  if ! "${as_root[@]}" env DEBIAN_FRONTEND=noninteractive apt-get "$@" </dev/null >"$log" 2>&1; then
    echo "$script: apt-get $1 failed:" >&2
    tail -n 20 "$log" >&2
    exit 1
  fi
}
echo "$script: reading the package lists"
run_apt update --quiet
echo "$script: downloading and installing (some minutes on a fresh machine)"
run_apt install --yes --quiet --no-install-recommends "${missing[@]}"
echo "$script: done"
