/* The interface of the pseudo TA that knows what belongs to a boot, for C and C++. */
#ifndef BOOT_SEED_H
#define BOOT_SEED_H

/* clang-format off */
/* b09e64c8-e726-4804-ad02-4425ff7f8c0f */
#define BOOT_SEED_PTA_UUID \
  {0xb09e64c8, 0xe726, 0x4804, {0xad, 0x02, 0x44, 0x25, 0xff, 0x7f, 0x8c, 0x0f}}
/* clang-format on */

/*
 * BOOT_SEED_GET: the seed of this boot.
 *   [out] memref[0]  BOOT_SEED_SIZE bytes
 * TEE_ERROR_ACCESS_DENIED to everyone but the trusted applications that issue or check tokens.
 * TEE_ERROR_BAD_STATE to the second instance of the Keymaster in one boot.
 */
#define BOOT_SEED_GET 0
#define BOOT_SEED_SIZE 32

#endif
