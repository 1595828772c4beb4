#!/usr/bin/env bash
# Installs the Debian packages that building needs and that are not there yet.
#   scripts/setup.sh [--tests] [--bench] [--checks] [--all]
# With nothing missing it changes nothing, asks nobody and needs no network. KEYMASTER_NO_SETUP=1
# leaves everything to whoever runs it.
set -euo pipefail

build=(g++ cmake ninja-build pkg-config libssl-dev libsqlite3-dev libcli11-dev nlohmann-json3-dev
       openssl)
tests=(libgtest-dev sqlite3 python3 g++-arm-linux-gnueabihf g++-aarch64-linux-gnu
       qemu-user)
bench=(libbenchmark-dev)
checks=(git python3 binutils clang libclang-rt-dev clang-format clang-tidy)

usage() {
  sed -n '2,5s/^# \{0,1\}//p' "$0"
}

wanted=("${build[@]}")
for option in "$@"; do
  case $option in
    --tests) wanted+=("${tests[@]}") ;;
    --bench) wanted+=("${bench[@]}") ;;
    --checks) wanted+=("${checks[@]}") ;;
    --all) wanted+=("${tests[@]}" "${bench[@]}" "${checks[@]}") ;;
    --help) usage; exit 0 ;;
    *) usage >&2; exit 2 ;;
  esac
done

if [[ ${KEYMASTER_NO_SETUP:-} == 1 ]]; then
  exit 0
fi
if ! command -v dpkg-query >/dev/null || ! command -v apt-get >/dev/null; then
  echo "setup: no apt here; what is installed is used. Debian's names for it: ${wanted[*]}" >&2
  exit 0
fi

missing=()
for package in "${wanted[@]}"; do
  state=$(dpkg-query -W -f '${db:Status-Status}' "$package" 2>/dev/null || true)
  [[ $state == installed ]] || missing+=("$package")
done
if ((${#missing[@]} == 0)); then
  exit 0
fi

as_root=()
if [[ $(id -u) != 0 ]]; then
  if ! command -v sudo >/dev/null; then
    echo "setup: as root, run: apt-get install --no-install-recommends ${missing[*]}" >&2
    exit 1
  fi
  as_root=(sudo)
fi

echo "setup: installing ${missing[*]}"
log=$(mktemp)
trap 'rm -f "$log"' EXIT
install_missing() {
  "${as_root[@]}" apt-get update -q &&
  "${as_root[@]}" env DEBIAN_FRONTEND=noninteractive \
      apt-get install -y -q --no-install-recommends "${missing[@]}"
}
if ! install_missing >"$log" 2>&1 </dev/null; then
  tail -n 20 "$log" >&2
  echo "setup: the packages above could not be installed" >&2
  exit 1
fi
