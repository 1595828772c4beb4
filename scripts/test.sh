#!/usr/bin/env bash
# Installs what is missing, builds, and runs every test:
#   release  the product as it is installed
#   asan     the same under AddressSanitizer, UndefinedBehaviorSanitizer and the leak checker
#   arm32    the same on 32-bit ARM, under qemu
# Name presets to run only those: scripts/test.sh asan
set -euo pipefail
cd "$(dirname "$0")/.."

presets=("$@")
((${#presets[@]})) || presets=(release asan arm32)

scripts/setup.sh --tests --bench
for preset in "${presets[@]}"; do
  echo "== $preset"
  [[ $preset != arm32 ]] || scripts/arm_sysroot
  cmake --preset "$preset" >/dev/null
  cmake --build --preset "$preset"
  ctest --preset "$preset" --parallel "$(nproc)"
done
