// Objects: attributes in and out, their rules, handles, and keys found again.
#include <algorithm>
#include <functional>

#include "support.h"
#include "tee/core/object.h"

namespace tee::test {
namespace {

using objects = in_instance;
using objects_death = in_instance;

TEE_ObjectHandle allocate(uint32_t type, uint32_t bits) {
  TEE_ObjectHandle object = nullptr;
  EXPECT_EQ(TEE_AllocateTransientObject(type, bits, &object), TEE_SUCCESS);
  return object;
}

TEST_F(objects, a_secret_comes_back_as_it_went_in) {
  const bytes secret = {0, 0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14};
  TEE_ObjectHandle object = allocate(TEE_TYPE_AES, 256);
  // A length that no key has is refused, and the object takes another one.
  const bytes odd(20);
  TEE_Attribute attribute = ref(TEE_ATTR_SECRET_VALUE, odd);
  EXPECT_EQ(TEE_PopulateTransientObject(object, &attribute, 1), TEE_ERROR_BAD_PARAMETERS);
  attribute = ref(TEE_ATTR_SECRET_VALUE, secret);
  EXPECT_EQ(TEE_PopulateTransientObject(object, &attribute, 1), TEE_SUCCESS);
  for (size_t capacity : {size_t{0}, size_t{15}, size_t{16}, size_t{17}}) {
    bytes room(capacity);
    size_t length = capacity;
    TEE_Result expected = capacity < 16 ? TEE_ERROR_SHORT_BUFFER : TEE_SUCCESS;
    EXPECT_EQ(TEE_GetObjectBufferAttribute(object, TEE_ATTR_SECRET_VALUE, room.data(), &length),
              expected);
    EXPECT_EQ(length, 16U);
    if (expected == TEE_SUCCESS) room.resize(16);
    EXPECT_EQ(room == secret, expected == TEE_SUCCESS);
  }
  size_t length = 0;
  EXPECT_EQ(TEE_GetObjectBufferAttribute(object, TEE_ATTR_RSA_MODULUS, nullptr, &length),
            TEE_ERROR_ITEM_NOT_FOUND);
  TEE_ObjectInfo info;
  EXPECT_EQ(TEE_GetObjectInfo1(object, &info), TEE_SUCCESS);
  EXPECT_EQ(info.objectSize, 128U);
  EXPECT_EQ(info.maxObjectSize, 256U);
  EXPECT_EQ(info.objectUsage, 0xFFFFFFFF);
  TEE_CloseObject(object);
}

// The key behind an object is the one made before for the same secret, until enough others came; a
// like secret of another type is another key.
TEST_F(objects, keys_are_found_again) {
  auto key_of = [&](uint32_t type, uint8_t fill) {
    TEE_ObjectHandle object = secret_key(type, bytes(32, fill));
    auto key = ta_.objects().get(object, "test").key;
    TEE_FreeTransientObject(object);
    return key;
  };
  auto first = key_of(TEE_TYPE_AES, 0);
  EXPECT_EQ(key_of(TEE_TYPE_AES, 0), first);
  EXPECT_NE(key_of(TEE_TYPE_HMAC_SHA256, 0), first);
  for (uint8_t fill = 1; fill < crypto::key_cache::SIZE - 1; ++fill)
    key_of(TEE_TYPE_AES, fill);
  EXPECT_EQ(key_of(TEE_TYPE_AES, 0), first);
  for (uint8_t fill = 100; fill < 100 + crypto::key_cache::SIZE; ++fill) {
    key_of(TEE_TYPE_AES, fill);
  }
  EXPECT_NE(key_of(TEE_TYPE_AES, 0), first);
}

TEST_F(objects_death, programming_errors_panic) {
  const bytes secret(16);
  const bytes long_secret(32);
  TEE_ObjectHandle empty = allocate(TEE_TYPE_AES, 128);
  TEE_ObjectHandle full = secret_key(TEE_TYPE_AES, secret);
  TEE_ObjectHandle stale = allocate(TEE_TYPE_AES, 128);
  TEE_FreeTransientObject(stale);
  TEE_ObjectHandle recycled = allocate(TEE_TYPE_AES, 128);  // in the slot of the stale one
  auto digest = operation(TEE_ALG_SHA256, TEE_MODE_DIGEST, 0, nullptr);
  instance other(UUID, shared_device(), HEAP_LIMIT);
  const TEE_Attribute good = ref(TEE_ATTR_SECRET_VALUE, secret);
  const TEE_Attribute twice[] = {good, good};
  const TEE_Attribute too_long = ref(TEE_ATTR_SECRET_VALUE, long_secret);
  const TEE_Attribute foreign = ref(TEE_ATTR_RSA_MODULUS, secret);
  TEE_Attribute null_buffer = good;
  null_buffer.content.ref.buffer = nullptr;
  TEE_ObjectInfo info;
  auto populate_empty = [&](const TEE_Attribute* attributes, uint32_t count) {
    (void)TEE_PopulateTransientObject(empty, attributes, count);
  };
  const std::pair<const char*, std::function<void()>> rows[] = {
      {"GetObjectInfo1: object handle .* is not valid", [&] { TEE_GetObjectInfo1(stale, &info); }},
      {"GetObjectInfo1: object handle .* is not valid",
       [&] { TEE_GetObjectInfo1(reinterpret_cast<TEE_ObjectHandle>(digest), &info); }},
      {"GetObjectInfo1: object handle .* is not valid",
       [&] {
         instance_scope inside(other);
         TEE_GetObjectInfo1(full, &info);
       }},
      {"Populate.*: object is initialised already",
       [&] { (void)TEE_PopulateTransientObject(full, &good, 1); }},
      {"Populate.*: a mandatory attribute is missing", [&] { populate_empty(nullptr, 0); }},
      {"Populate.*: an attribute is given twice", [&] { populate_empty(twice, 2); }},
      {"Populate.*: an attribute does not belong", [&] { populate_empty(&foreign, 1); }},
      {"Populate.*: an attribute of 32 bytes exceeds", [&] { populate_empty(&too_long, 1); }},
      {"Populate.*: an attribute's buffer is null", [&] { populate_empty(&null_buffer, 1); }},
      {"GenerateKey: key size 256 does not fit",
       [&] { (void)TEE_GenerateKey(empty, 256, nullptr, 0); }},
  };
  for (const auto& [message, call] : rows) {
    EXPECT_DEATH(call(), std::string("panic: TEE_.*") + message) << message;
  }
  EXPECT_NE(recycled, stale);
}

}  // namespace
}  // namespace tee::test
