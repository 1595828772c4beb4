#!/usr/bin/env bash
# Installs what is missing, builds, and shows a device at work: keys, signatures, refusals, an
# upgrade. Everything happens in a temporary folder that is gone afterwards.
set -euo pipefail
cd "$(dirname "$0")/.."

scripts/setup.sh
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
build=build/release
if [[ ! -x $build/bin/kmtool ]]; then  # a folder of its own, without tests, which want more packages
  build=build/demo
  cmake --preset release -B "$build" -DKEYMASTER_TESTS=OFF -DKEYMASTER_BENCH=OFF >/dev/null
fi
echo "Building in $build; the first time takes a minute or two"
if [[ -t 1 ]]; then
  cmake --build "$build"
else
  cmake --build "$build" >"$work/build.log" || { grep -vE "^\[[0-9]+/" "$work/build.log"; exit 1; }
fi

cp README.md "$work"
PATH=$PWD/$build/bin:$PATH
cd "$work"
export KEYMASTER_DEVICE=$work/device TEE_TRACE_LEVEL=0

bold='' plain=''
if [[ -t 1 ]]; then
  bold=$'\e[1m' plain=$'\e[0m'
fi
say() {
  printf '\n%s%s%s\n' "$bold" "$1" "$plain"
}
# run COMMAND...: shows the command and what it prints.
run() {
  printf '\n  $ %s\n' "$*"
  "$@" 2>&1 | sed 's/^/    /'
}
# refused COMMAND...: the same for a command that the TA must refuse (exit code 1).
refused() {
  local code=0
  run "$@" || code=$?
  if [[ $code != 1 ]]; then
    echo "demo: this should have been refused (exit code $code)" >&2
    exit 1
  fi
}
# same A B WHAT: both are the same text.
same() {
  if [[ $1 != "$2" ]]; then
    echo "demo: $3 differ: $1 and $2" >&2
    exit 1
  fi
}

say "1. A device: an identity, a boot, and storage of its own"
run kmtool device create --os-version 120000 --os-patchlevel 202401

say "2. A key is made inside the device; only an encrypted blob comes out"
run kmtool generate hmac -o release.key --size 256 --digest sha256 --min-mac 128 \
    --purpose sign --app-id release-desk
run kmtool show release.key --app-id release-desk
run kmtool sign release.key -i README.md --app-id release-desk

say "3. The blob is bound to its application: another one is refused"
refused kmtool sign release.key -i README.md --app-id somebody-else

say "4. A key of known bytes, imported: openssl computes the same MAC"
head -c 32 /dev/urandom >known.bin
run kmtool import hmac known.bin -o known.key --digest sha256 --min-mac 128 --purpose sign
run kmtool sign known.key -i README.md -o known.mac
hex() { od -An -v -tx1 "$1" | tr -d ' \n'; }
ours=$(hex known.mac)
theirs=$(openssl mac -digest SHA256 -macopt "hexkey:$(hex known.bin)" -in README.md HMAC | tr A-F a-f)
printf '\n    device   %s\n    openssl  %s\n' "$ours" "$theirs"
same "$ours" "$theirs" "the MACs"

say "5. RSA and EC keys sign; openssl verifies with the exported public keys"
run kmtool generate rsa -o rsa.key --purpose sign --digest sha256 --padding pss
run kmtool generate ec -o ec.key --purpose sign --digest sha256
run kmtool export rsa.key -o rsa.pem
run kmtool export ec.key -o ec.pem
run kmtool sign rsa.key -i README.md -o rsa.sig
run kmtool sign ec.key -i README.md -o ec.sig
run openssl dgst -sha256 -sigopt rsa_padding_mode:pss -verify rsa.pem -signature rsa.sig README.md
run openssl dgst -sha256 -verify ec.pem -signature ec.sig README.md

say "6. The device vouches for a key: an attestation, and what it says"
run kmtool attest ec.key --challenge c0ffee -o chain.pem
run kmtool inspect chain.pem
awk '/BEGIN/ {n++} {print > ("link" n ".pem")}' chain.pem
run openssl verify -no_check_time -CAfile link2.pem link1.pem

say "7. 100 MB through AES-GCM and back, in bounded memory"
head -c 100000000 /dev/urandom >big.bin
run kmtool generate aes -o aes.key --mode gcm
kmtool encrypt aes.key -i big.bin -o big.enc | sed 's/^/    /'
kmtool decrypt aes.key -i big.enc -o big.dec | sed 's/^/    /'
cmp big.bin big.dec
printf '    the same bytes again\n'
rm big.bin big.enc big.dec

say "8. The device's OS is updated: keys of the old version want an upgrade"
run kmtool device set --os-version 130000
refused kmtool sign known.key -i README.md -o again.mac
run kmtool upgrade known.key -o upgraded.key
run kmtool sign upgraded.key -i README.md -o again.mac
same "$(hex again.mac)" "$ours" "the MACs before and after the upgrade"
printf '    the same MAC as before\n'

say "9. A restart: a new boot, and the old blob still opens"
run kmtool device reboot
run kmtool upgrade known.key -o after-restart.key
run kmtool sign after-restart.key -i README.md -o restart.mac
same "$(hex restart.mac)" "$ours" "the MACs before and after the restart"
printf '    the same MAC again\n'

say "10. One bit of a blob is changed: it is no key any more"
cp upgraded.key damaged.key
byte=$(od -An -tu1 -j 200 -N 1 damaged.key)
printf "\\x$(printf %x $((byte ^ 1)))" | dd of=damaged.key bs=1 seek=200 conv=notrunc status=none
refused kmtool sign damaged.key -i README.md

say "11. SOTER: the device's own key vouches for a key that signs documents"
run kmtool soter export-attk -o attk.pem
run kmtool generate rsa -o soter.key --soter --uid 1000 --padding pkcs1-sign
run kmtool soter export soter.key -o key.json --public-key soter.pem
run openssl dgst -sha256 -verify attk.pem -signature key.json.sig key.json

say "12. A finger, a message, a signed document; the counter rises from run to run"
printf 'pay 10.00 to Ann' >payment
run kmtool sign soter.key -i payment --fingerprint 7 -o first.json
run openssl dgst -sha256 -verify soter.pem -signature first.json.sig first.json
run kmtool soter verify first.json first.json.sig --key soter.pem
run kmtool sign soter.key -i payment -o second.json
run kmtool soter verify second.json second.json.sig --key soter.pem

say "13. A device that stays: two programs at once, and a limit that holds over programs"
export KEYMASTER_DEVICE=teed:$work/device
trap 'kmtool device stop >/dev/null || true; rm -rf "$work"' EXIT
run kmtool generate hmac -o twice.key --size 256 --digest sha256 --min-mac 128 --purpose sign \
    --param max_uses_per_boot=2
kmtool sign twice.key -i README.md -o one.mac >/dev/null &
run kmtool sign twice.key -i README.md -o other.mac
wait $!
same "$(hex one.mac)" "$(hex other.mac)" "the MACs of the two programs"
run kmtool device show
refused kmtool sign twice.key -i README.md
run kmtool device reboot
run kmtool sign twice.key -i README.md
run kmtool device stop

say "That was a device. Make one of your own: kmtool device create (in $build/bin)"
