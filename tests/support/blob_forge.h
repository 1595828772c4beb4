// Key blobs as the format describes them, made and taken apart with libcrypto alone: what the TA
// seals can be looked into, and the TA can be given blobs that it would never make.
#pragma once

#include "keymaster/client/bytes.h"
#include "keymaster/client/param_set.h"

namespace keymaster::test {

// The key storage key that is derived on the device of the tests.
client::bytes derived_ksk();

// blob_plaintext: key material and characteristics as they stand in a blob.
client::bytes blob_plaintext(client::byte_view material, const client::param_set& characteristics);

// hmac_material: the record of an HMAC key. `object_type` is the platform's, by its digest.
client::bytes hmac_material(client::byte_view key, uint32_t object_type = 0xA0000004);

// seal: a blob with salt bytes 0x5A and nonce bytes 0xA5, under `ksk`.
client::bytes seal(client::byte_view plaintext, client::byte_view ksk = derived_ksk(),
                   uint8_t protection = 0);

// unseal: the plaintext of a blob; throws std::runtime_error when it is not authentic.
client::bytes unseal(client::byte_view blob, client::byte_view ksk = derived_ksk());

}  // namespace keymaster::test
