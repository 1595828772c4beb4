#!/usr/bin/env bash
# Makes a test attestation key (RSA-2048) and its self-signed certificate of exactly 783 bytes, and
# writes them as the C++ data file that the TA is built with. Usage:
#   scripts/make_attestation_key.sh FILE.cpp
# A product does not run this: it provisions its own numbers in a file of the same form.
set -euo pipefail

output=${1:?usage: make_attestation_key.sh FILE.cpp}
certificate_size=783
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
cd "$work"

# The n-th INTEGER of the PKCS #1 private key, in hex, padded with zeros to $2 digits.
number() {
  local hex
  hex=$(openssl asn1parse -in key.der -inform DER | awk -F: '/INTEGER/ {print $NF}' | sed -n "$1p")
  printf '%*s' "$2" "$hex" | tr ' ' 0
}

# Writes the to-be-signed part, with a comment of $1 characters that brings it to its size.
write_tbs() {
  local comment name modulus
  comment=$(printf 'TEST KEY %*s' "$1" '' | tr ' ' '.')
  name=$(printf 'Android Keymaster\0' | od -An -tx1 | tr -d ' \n')
  modulus=$(number 2 514)
  cat > tbs.cnf <<END
asn1=SEQUENCE:tbs
[tbs]
version=EXPLICIT:0,INTEGER:2
serial=INTEGER:1
algorithm=SEQUENCE:signature
issuer=SEQUENCE:name
validity=SEQUENCE:validity
subject=SEQUENCE:name
key=SEQUENCE:key
extensions=EXPLICIT:3,SEQUENCE:extensions
[signature]
id=OID:sha256WithRSAEncryption
parameters=NULL
[name]
rdn=SET:rdn
[rdn]
attribute=SEQUENCE:common_name
[common_name]
type=OID:2.5.4.3
value=IMPLICIT:12U,FORMAT:HEX,OCTETSTRING:$name
[validity]
not_before=UTCTIME:161108030237Z
not_after=UTCTIME:161208030237Z
[key]
algorithm=SEQUENCE:rsa
bits=BITWRAP,SEQUENCE:numbers
[rsa]
id=OID:rsaEncryption
parameters=NULL
[numbers]
n=INTEGER:0x$modulus
e=INTEGER:0x010001
[extensions]
constraints=SEQUENCE:constraints
usage=SEQUENCE:usage
comment=SEQUENCE:comment
[constraints]
id=OID:2.5.29.19
critical=BOOLEAN:TRUE
value=OCTWRAP,SEQUENCE:constraints_value
[constraints_value]
ca=BOOLEAN:TRUE
[usage]
id=OID:2.5.29.15
critical=BOOLEAN:TRUE
value=OCTWRAP,FORMAT:BITLIST,BITSTRING:5
[comment]
id=OID:2.16.840.1.113730.1.13
value=OCTWRAP,IA5STRING:$comment
END
  openssl asn1parse -genconf tbs.cnf -noout -out tbs.der
}

# Prints bytes given in hex.
bytes() {
  printf "$(printf '%s' "$1" | sed 's/../\\x&/g')"
}

write_certificate() {
  local content
  openssl dgst -sha256 -sign key.pem -out signature.bin tbs.der
  content=$(($(stat -c %s tbs.der) + 15 + 5 + 256))
  {
    bytes "$(printf '3082%04x' "$content")"
    cat tbs.der
    bytes 300d06092a864886f70d01010b0500
    bytes 0382010100
    cat signature.bin
  } > certificate.der
}

# A C++ array named $1 from the hex in $2.
array() {
  printf 'constexpr unsigned char %s[] = {\n' "$1"
  printf '%s' "$2" | sed 's/../0x&, /g' | fold -s -w 96 | sed 's/^/    /; s/ *$//'
  printf '\n};\n'
}

openssl genrsa -out key.pem 2048 2> genrsa.log
openssl rsa -in key.pem -traditional -outform DER -out key.der 2>> genrsa.log
write_tbs 0
write_certificate
write_tbs $((certificate_size - $(stat -c %s certificate.der)))
write_certificate
[ "$(stat -c %s certificate.der)" = "$certificate_size" ] || {
  echo "the certificate has $(stat -c %s certificate.der) bytes instead of $certificate_size" >&2
  exit 1
}
openssl x509 -inform DER -in certificate.der -noout -text > /dev/null

cd "$OLDPWD"
{
  cat <<'END'
// TEST KEY: the attestation key (RSA-2048, big-endian numbers) and its certificate (DER) for
// development, made by scripts/make_attestation_key.sh. Its private exponent is public: a product
// provisions its own (CMake option KEYMASTER_ATTESTATION_KEY).
#pragma once

// clang-format off
END
  cd "$work"
  array ATTESTATION_MODULUS "$(number 2 514)"
  printf '\n'
  array ATTESTATION_PUBLIC_EXPONENT 010001
  printf '\n'
  array ATTESTATION_PRIVATE_EXPONENT "$(number 4 512)"
  printf '\n'
  array ATTESTATION_CERTIFICATE "$(od -An -v -tx1 certificate.der | tr -d ' \n')"
  cd "$OLDPWD"
  echo '// clang-format on'
} > "$output"
