// The strict profile: what a lenient platform answers and a strict one does not.
#include <algorithm>
#include <functional>

#include "support.h"
#include "tee/controls/host_control.h"
#include "tee/core/session.h"

namespace tee::test {
namespace {

class strict : public in_instance {
 protected:
  void SetUp() override { host::set_profile({.strict = true}); }
  void TearDown() override { host::set_profile({}); }
};
using strict_death = strict;

TEE_ObjectHandle allocate(uint32_t type, uint32_t bits) {
  TEE_ObjectHandle object = nullptr;
  EXPECT_EQ(TEE_AllocateTransientObject(type, bits, &object), TEE_SUCCESS);
  return object;
}

TEE_ObjectHandle new_rsa_key() {
  TEE_ObjectHandle key = allocate(TEE_TYPE_RSA_KEYPAIR, 512);
  EXPECT_EQ(TEE_GenerateKey(key, 512, nullptr, 0), TEE_SUCCESS);
  return key;
}

TEST_F(strict_death, what_the_standard_lets_a_platform_panic_about) {
  const bytes number(65);
  const bytes block(16);
  bytes memory(64);
  size_t length = memory.size();
  size_t tag_length = 16;
  TEE_Attribute salt;
  TEE_InitValueAttribute(&salt, TEE_ATTR_RSA_PSS_SALT_LENGTH, 43, 0);
  const TEE_Attribute long_numbers[] = {ref(TEE_ATTR_RSA_MODULUS, number),
                                        ref(TEE_ATTR_RSA_PUBLIC_EXPONENT, {})};
  auto rsa = allocate(TEE_TYPE_RSA_PUBLIC_KEY, 512);
  const auto signer = [](uint32_t algorithm) {
    return operation(algorithm, TEE_MODE_SIGN, 512, new_rsa_key());
  };
  auto pkcs1 = signer(TEE_ALG_RSASSA_PKCS1_V1_5_SHA512);
  auto pss = signer(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA1);
  auto gcm = operation(TEE_ALG_AES_GCM, TEE_MODE_ENCRYPT, 128, secret_key(TEE_TYPE_AES, block));
  ASSERT_EQ(TEE_AEInit(gcm, block.data(), 12, 128, 0, 0), TEE_SUCCESS);
  auto ctr = operation(TEE_ALG_AES_CTR, TEE_MODE_ENCRYPT, 128, secret_key(TEE_TYPE_AES, block));
  TEE_CipherInit(ctr, block.data(), block.size());
  call_parameters parameters{.types = TEE_PARAM_TYPE_MEMREF_INOUT};
  parameters.slots[0].memref = {memory.data(), 32};
  instance_scope entered(ta_, &parameters);
  const std::pair<const char*, std::function<void()>> rows[] = {
      {"PopulateTransientObject: an attribute of 65 bytes exceeds the object's 512 bits",
       [&] { (void)TEE_PopulateTransientObject(rsa, long_numbers, 2); }},
      {"AsymmetricSignDigest: the key cannot sign that",
       [&] {
         (void)TEE_AsymmetricSignDigest(pkcs1, nullptr, 0, number.data(), 64, memory.data(),
                                        &length);
       }},
      {"AsymmetricSignDigest: the key cannot sign that",
       [&] {
         (void)TEE_AsymmetricSignDigest(pss, &salt, 1, number.data(), 20, memory.data(), &length);
       }},
      {"AsymmetricSignDigest: parameter 0xf0000a30 is unknown",
       [&] {
         (void)TEE_AsymmetricSignDigest(pkcs1, &salt, 1, number.data(), 64, memory.data(), &length);
       }},
      {"AEUpdate: input and output share memory",
       [&] { (void)TEE_AEUpdate(gcm, memory.data(), 16, memory.data(), &length); }},
      {"AEEncryptFinal: input and output share memory",
       [&] {
         (void)TEE_AEEncryptFinal(gcm, memory.data(), 16, memory.data() + 15, &(length = 16),
                                  memory.data() + 40, &tag_length);
       }},
      {"CipherUpdate: input and output share memory",
       [&] { (void)TEE_CipherUpdate(ctr, memory.data() + 1, 16, memory.data(), &length); }},
      {"GenerateRandom: randomBuffer is in memory of the client",
       [&] { TEE_GenerateRandom(memory.data() + 31, 1); }},
      {"Malloc: hint 0x4 is unknown", [&] { TEE_Malloc(1, 4); }},
  };
  for (const auto& [message, call] : rows) {
    EXPECT_DEATH(call(), std::string("panic: TEE_") + message) << message;
  }
  TEE_GenerateRandom(memory.data() + 32, 1);
  EXPECT_EQ(TEE_CipherUpdate(ctr, memory.data(), 16, memory.data(), &length), TEE_SUCCESS);
}

TEST_F(strict, limits_and_memory) {
  TEE_ObjectHandle object = nullptr;
  TEE_OperationHandle made = nullptr;
  for (uint32_t type : {TEE_TYPE_RSA_KEYPAIR, TEE_TYPE_RSA_PUBLIC_KEY}) {
    EXPECT_EQ(TEE_AllocateTransientObject(type, 4104, &object), TEE_ERROR_NOT_SUPPORTED);
  }
  for (uint32_t bits : {0, 4104}) {
    EXPECT_EQ(TEE_AllocateOperation(&made, TEE_ALG_RSA_NOPAD, TEE_MODE_DECRYPT, bits),
              TEE_ERROR_NOT_SUPPORTED);
  }
  auto* block = static_cast<uint8_t*>(TEE_Malloc(8, TEE_MALLOC_FILL_ZERO));
  EXPECT_EQ(std::count(block, block + 8, 0), 8);
  block = static_cast<uint8_t*>(TEE_Realloc(block, 16));
  EXPECT_EQ(std::count(block, block + 8, 0), 8);
  EXPECT_EQ(std::count(block + 8, block + 16, 0xA5), 8);
  TEE_Free(block);
  // There is no result by which making a key could tell of a lack of memory.
  host::fail_nth_call(2, TEE_ERROR_OUT_OF_MEMORY);
  object = new_rsa_key();
  EXPECT_FALSE(host::fault_fired());
  host::clear_fault();
  TEE_FreeTransientObject(object);
}

}  // namespace
}  // namespace tee::test
