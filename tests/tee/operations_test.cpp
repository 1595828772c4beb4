// Operations: what their keys and states forbid.
#include <functional>

#include "support.h"

namespace tee::test {
namespace {

using operations_death = in_instance;

TEST_F(operations_death, calls_that_do_not_fit_panic) {
  const bytes block(16);
  uint8_t out[64];
  size_t length = sizeof(out);
  auto aes = [] { return secret_key(TEE_TYPE_AES, bytes(16)); };
  auto mac_key = secret_key(TEE_TYPE_HMAC_SHA1, bytes(16));
  TEE_ObjectHandle empty = nullptr;
  ASSERT_EQ(TEE_AllocateTransientObject(TEE_TYPE_AES, 128, &empty), TEE_SUCCESS);
  auto big_key = secret_key(TEE_TYPE_AES, bytes(32));
  auto digest = operation(TEE_ALG_SHA256, TEE_MODE_DIGEST, 0, nullptr);
  auto keyless = operation(TEE_ALG_AES_CBC_NOPAD, TEE_MODE_ENCRYPT, 128, nullptr);
  auto initial = operation(TEE_ALG_AES_CBC_NOPAD, TEE_MODE_ENCRYPT, 128, aes());
  const bytes modulus(64, 0xFF), exponent = {3};
  const TEE_Attribute numbers[] = {ref(TEE_ATTR_RSA_MODULUS, modulus),
                                   ref(TEE_ATTR_RSA_PUBLIC_EXPONENT, exponent)};
  TEE_ObjectHandle half = nullptr;
  ASSERT_EQ(TEE_AllocateTransientObject(TEE_TYPE_RSA_PUBLIC_KEY, 512, &half), TEE_SUCCESS);
  ASSERT_EQ(TEE_PopulateTransientObject(half, numbers, 2), TEE_SUCCESS);
  auto encrypter = operation(TEE_ALG_RSA_NOPAD, TEE_MODE_ENCRYPT, 512, nullptr);
  ASSERT_EQ(TEE_SetOperationKey(encrypter, half), TEE_SUCCESS);
  auto decrypter = operation(TEE_ALG_RSA_NOPAD, TEE_MODE_DECRYPT, 512, nullptr);
  auto dropped = operation(TEE_ALG_AES_CBC_NOPAD, TEE_MODE_ENCRYPT, 128, aes());
  ASSERT_EQ(TEE_SetOperationKey(dropped, nullptr), TEE_SUCCESS);
  auto running = operation(TEE_ALG_AES_ECB_NOPAD, TEE_MODE_ENCRYPT, 128, aes());
  TEE_CipherInit(running, nullptr, 0);
  auto sealing = operation(TEE_ALG_AES_GCM, TEE_MODE_ENCRYPT, 128, aes());
  ASSERT_EQ(TEE_AEInit(sealing, block.data(), 12, 128, 0, 0), TEE_SUCCESS);
  ASSERT_EQ(TEE_AEUpdate(sealing, block.data(), 1, out, &length), TEE_SUCCESS);
  const std::pair<const char*, std::function<void()>> rows[] = {
      {"SetOperationKey: a digest takes no key", [&] { TEE_SetOperationKey(digest, empty); }},
      {"SetOperationKey: key is not an initialised", [&] { TEE_SetOperationKey(keyless, empty); }},
      {"SetOperationKey: key of type", [&] { TEE_SetOperationKey(keyless, mac_key); }},
      {"SetOperationKey: key of 256 bits", [&] { TEE_SetOperationKey(keyless, big_key); }},
      {"SetOperationKey: key of type", [&] { TEE_SetOperationKey(decrypter, half); }},
      {"SetOperationKey: key of type", [&] { TEE_SetOperationKey(encrypter, mac_key); }},
      {"CipherInit: operation has no key", [&] { TEE_CipherInit(dropped, block.data(), 16); }},
      {"DigestUpdate: operation of algorithm", [&] { TEE_DigestUpdate(initial, out, 1); }},
      {"DigestUpdate: chunk is null with length 1", [&] { TEE_DigestUpdate(digest, nullptr, 1); }},
      {"CipherInit: operation has no key", [&] { TEE_CipherInit(keyless, block.data(), 16); }},
      {"CipherInit: IV of 12 bytes", [&] { TEE_CipherInit(initial, block.data(), 12); }},
      {"CipherUpdate: operation is not initialised",
       [&] { TEE_CipherUpdate(initial, block.data(), 1, out, &length); }},
      {"CipherDoFinal: the message ends inside a block",
       [&] { TEE_CipherDoFinal(running, block.data(), 15, out, &length); }},
      {"AEUpdateAAD: associated data after payload",
       [&] { TEE_AEUpdateAAD(sealing, block.data(), 1); }},
      {"AEDecryptFinal: operation is of mode 0, not 1",
       [&] { TEE_AEDecryptFinal(sealing, nullptr, 0, nullptr, &(length = 0), out, 16); }},
      {"Panic: code 0xffff0007", [&] { TEE_Panic(TEE_ERROR_BAD_STATE); }},
  };
  for (const auto& [message, call] : rows) {
    EXPECT_DEATH(call(), std::string("panic: TEE_") + message) << message;
  }
}

}  // namespace
}  // namespace tee::test
