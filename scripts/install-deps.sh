#!/usr/bin/env bash
# Installs, with apt-get, the Debian packages a group of jobs needs, and only
# those that are missing (so a prepared machine is not touched).
#   install-deps.sh GROUP...   groups: build arm static bench fuzz
set -euo pipefail

declare -A groups=(
    [build]="cmake g++ make pkg-config libsqlite3-dev googletest libgtest-dev sqlite3 libbenchmark-dev libsqlitecpp-dev"
    [arm]="g++-arm-linux-gnueabihf qemu-user"
    [static]="clang-tidy clang-format"
    [bench]="libbenchmark-dev libsqlitecpp-dev gnuplot-nox python3"
    [fuzz]="clang libclang-rt-14-dev"
)

wanted=()
for group in "$@"; do
    [[ -n "${groups[$group]:-}" ]] || { echo "install-deps: unknown group '$group'" >&2; exit 2; }
    read -ra names <<<"${groups[$group]}"
    wanted+=("${names[@]}")
done

missing=()
for name in "${wanted[@]}"; do
    dpkg-query -W -f='${Status}' "$name" 2>/dev/null | grep -q "install ok installed" || missing+=("$name")
done
[[ ${#missing[@]} -eq 0 ]] && exit 0

sudo=""
[[ $(id -u) -eq 0 ]] || sudo="sudo"
echo "install-deps: installing ${missing[*]}"
$sudo apt-get update -qq || echo "install-deps: apt-get update reported errors; trying with the lists we have" >&2
DEBIAN_FRONTEND=noninteractive $sudo apt-get install -y -qq --no-install-recommends "${missing[@]}" >/dev/null
