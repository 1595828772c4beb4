// The identities of the trusted applications: the one place where a product changes them. The build
// reads this file, too, to name each <uuid>.ta, so every entry keeps its shape. The initialisers
// serve TEE_UUID and TEEC_UUID alike.
#pragma once

// clang-format off

// c1f6d2a8-3b0e-4f57-9a6d-2e8b7740d3f1
#define KEYMASTER_TA_UUID \
  {0xc1f6d2a8, 0x3b0e, 0x4f57, {0x9a, 0x6d, 0x2e, 0x8b, 0x77, 0x40, 0xd3, 0xf1}}

// The Keymaster of the device's earlier system: it alone opens the blobs that it made.
// a94d1f60-2c7b-4e83-b15c-0f6e3d98c2ab
#define EARLIER_KEYMASTER_TA_UUID \
  {0xa94d1f60, 0x2c7b, 0x4e83, {0xb1, 0x5c, 0x0f, 0x6e, 0x3d, 0x98, 0xc2, 0xab}}

// Keeps what the factory provisioned: the SOTER key and the device's properties.
// 5e0b9c44-71d2-4c1a-8f3e-b6a90d52e807
#define VAULT_TA_UUID \
  {0x5e0b9c44, 0x71d2, 0x4c1a, {0x8f, 0x3e, 0xb6, 0xa9, 0x0d, 0x52, 0xe8, 0x07}}

// Matches fingerprints; the only one that may report a match.
// e37a58d5-90f4-4b6c-a2d1-64c8f1b09375
#define FINGERPRINT_TA_UUID \
  {0xe37a58d5, 0x90f4, 0x4b6c, {0xa2, 0xd1, 0x64, 0xc8, 0xf1, 0xb0, 0x93, 0x75}}

// Issues the tokens that keys of a user want.
// 2d8c6b71-f45a-4309-86e2-93b1d07ca5fe
#define AUTHENTICATOR_TA_UUID \
  {0x2d8c6b71, 0xf45a, 0x4309, {0x86, 0xe2, 0x93, 0xb1, 0xd0, 0x7c, 0xa5, 0xfe}}
