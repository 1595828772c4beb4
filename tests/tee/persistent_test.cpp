// Persistent objects as a trusted application sees them.
#include "tee_internal_api.h"

#include <gtest/gtest.h>
#include <string>

#include "tee/controls/host_control.h"
#include "tee/core/instance.h"
#include "tee/core/persistent_stream.h"
#include "tee/core/stored_object.h"
#include "tee/device/object_store.h"
#include "tee/device/uuid.h"
#include "tests/tee/support.h"
#include "tests/tee/temp_device.h"

namespace tee::test {
namespace {

constexpr uint32_t READ = TEE_DATA_FLAG_ACCESS_READ;
constexpr uint32_t WRITE = TEE_DATA_FLAG_ACCESS_WRITE;
constexpr uint32_t META = TEE_DATA_FLAG_ACCESS_WRITE_META;
constexpr uint32_t SHARE_R = TEE_DATA_FLAG_SHARE_READ;
constexpr uint32_t SHARE_W = TEE_DATA_FLAG_SHARE_WRITE;
constexpr uint32_t OVERWRITE = TEE_DATA_FLAG_OVERWRITE;

constexpr size_t HEAP_LIMIT = 1 << 20;
constexpr TEE_UUID OWNER = {1, 2, 3, {4}};
constexpr TEE_UUID STRANGER = {1, 2, 3, {5}};

// Calls with the identifier "id\0" in the private storage.
TEE_Result open_object(uint32_t flags, TEE_ObjectHandle* object) {
  return TEE_OpenPersistentObject(TEE_STORAGE_PRIVATE, "id", 3, flags, object);
}

TEE_Result create_object(uint32_t flags, const std::string& data, TEE_ObjectHandle* object) {
  return TEE_CreatePersistentObject(TEE_STORAGE_PRIVATE, "id", 3, flags, nullptr, data.data(),
                                    data.size(), object);
}

std::string read_all(TEE_ObjectHandle object) {
  std::string data(200, '\0');
  size_t count = 0;
  EXPECT_EQ(TEE_ReadObjectData(object, data.data(), data.size(), &count), TEE_SUCCESS);
  data.resize(count);
  return data;
}

class persistent : public ::testing::Test {
 protected:
  temp_device made;
  std::unique_ptr<device> dev = made.open();
  instance owner{OWNER, *dev, HEAP_LIMIT};
  instance_scope running{owner};
  TEE_ObjectHandle object = nullptr;
  TEE_ObjectHandle second = nullptr;
};

TEST_F(persistent, flags_of_two_handles_agree_or_conflict) {
  // The flags of both, and whether they go together.
  const std::tuple<uint32_t, uint32_t, bool> cases[] = {
      {READ, READ, false},
      {READ | SHARE_R, READ | SHARE_R, true},
      {READ | SHARE_R, READ, false},
      {READ | SHARE_R, WRITE | SHARE_R, false},
      {READ | SHARE_R | SHARE_W, WRITE | SHARE_R | SHARE_W, true},
      {META | SHARE_R | SHARE_W, READ | SHARE_R | SHARE_W, false},
      {READ | SHARE_R, READ | SHARE_R | SHARE_W, false},
      {READ | SHARE_R | SHARE_W, SHARE_W, false},
      {READ | SHARE_W, READ | SHARE_W, false},
      {READ | SHARE_W, SHARE_W, false},
      {WRITE | SHARE_R, SHARE_R, false},
      {WRITE | SHARE_W, WRITE | SHARE_W, true},
      {SHARE_R, SHARE_W, false},
      {0, 0, false},
      {SHARE_R, SHARE_R, true},
      {0, META, false},
  };
  ASSERT_EQ(create_object(0, "data", &object), TEE_SUCCESS);
  TEE_CloseObject(object);
  for (auto [first, then, together] : cases) {
    for (auto [a, b] : {std::pair(first, then), std::pair(then, first)}) {
      ASSERT_EQ(open_object(a, &object), TEE_SUCCESS);
      TEE_Result expected = together ? TEE_SUCCESS : TEE_ERROR_ACCESS_CONFLICT;
      EXPECT_EQ(open_object(b, &second), expected) << a << " then " << b;
      EXPECT_EQ(second != nullptr, together);
      TEE_CloseObject(second);
      EXPECT_EQ(create_object(b | OVERWRITE, "data", &second), expected);
      TEE_CloseObject(second);
      EXPECT_EQ(create_object(b, "data", &second), TEE_ERROR_ACCESS_CONFLICT);
      TEE_CloseObject(object);
    }
  }
  EXPECT_EQ(owner.objects().size(), 0u);
}

TEST_F(persistent, an_object_is_shared_until_its_last_handle_closes) {
  constexpr uint32_t FLAGS = READ | SHARE_R;
  ASSERT_EQ(create_object(FLAGS, "data", &object), TEE_SUCCESS);
  TEE_ObjectHandle third = nullptr;
  ASSERT_EQ(open_object(FLAGS, &second), TEE_SUCCESS);
  ASSERT_EQ(open_object(FLAGS, &third), TEE_SUCCESS);
  for (TEE_ObjectHandle each : {second, object, third}) {
    EXPECT_EQ(create_object(OVERWRITE, "other", nullptr), TEE_ERROR_ACCESS_CONFLICT);
    TEE_CloseObject(each);
  }
  EXPECT_EQ(create_object(OVERWRITE, "other", nullptr), TEE_SUCCESS);
}

TEST_F(persistent, positions_and_writes_have_limits) {
  constexpr intmax_t LIMIT = STREAM_LIMIT;
  constexpr intmax_t LAST = TEE_DATA_MAX_POSITION;
  ASSERT_EQ(create_object(READ | WRITE, "0123456789", &object), TEE_SUCCESS);
  // A seek from position 4, its result, and the position then.
  const std::tuple<intmax_t, TEE_Whence, TEE_Result, intmax_t> seeks[] = {
      {0, TEE_DATA_SEEK_CUR, TEE_SUCCESS, 4},
      {-4, TEE_DATA_SEEK_CUR, TEE_SUCCESS, 0},
      {-5, TEE_DATA_SEEK_CUR, TEE_SUCCESS, 0},
      {-3, TEE_DATA_SEEK_END, TEE_SUCCESS, 7},
      {-11, TEE_DATA_SEEK_END, TEE_SUCCESS, 0},
      {INTMAX_MIN, TEE_DATA_SEEK_END, TEE_SUCCESS, 0},
      {LIMIT + 1, TEE_DATA_SEEK_SET, TEE_SUCCESS, LIMIT + 1},
      {LAST, TEE_DATA_SEEK_SET, TEE_SUCCESS, LAST},
      {LAST - 4, TEE_DATA_SEEK_CUR, TEE_SUCCESS, LAST},
      {LAST - 3, TEE_DATA_SEEK_CUR, TEE_ERROR_OVERFLOW, 4},
      {LAST - 9, TEE_DATA_SEEK_END, TEE_ERROR_OVERFLOW, 4},
      {INTMAX_MAX, TEE_DATA_SEEK_SET, TEE_ERROR_OVERFLOW, 4},
  };
  TEE_ObjectInfo info{};
  for (const auto& [offset, whence, result, position] : seeks) {
    ASSERT_EQ(TEE_SeekObjectData(object, 4, TEE_DATA_SEEK_SET), TEE_SUCCESS);
    EXPECT_EQ(TEE_SeekObjectData(object, offset, whence), result) << offset;
    ASSERT_EQ(TEE_GetObjectInfo1(object, &info), TEE_SUCCESS);
    EXPECT_EQ(static_cast<intmax_t>(info.dataPosition), position) << offset;
  }
  // Where two bytes are written, the result, and the length then.
  for (const auto& [position, result, length] : {std::tuple(intmax_t{3}, TEE_SUCCESS, size_t{10}),
                                                 {9, TEE_SUCCESS, 11},
                                                 {13, TEE_SUCCESS, 15},
                                                 {LIMIT - 1, TEE_ERROR_STORAGE_NO_SPACE, 15},
                                                 {LAST, TEE_ERROR_OVERFLOW, 15}}) {
    ASSERT_EQ(TEE_SeekObjectData(object, position, TEE_DATA_SEEK_SET), TEE_SUCCESS);
    EXPECT_EQ(TEE_WriteObjectData(object, "xy", 2), result) << position;
    ASSERT_EQ(TEE_GetObjectInfo1(object, &info), TEE_SUCCESS);
    EXPECT_EQ(info.dataSize, length);
    EXPECT_EQ(static_cast<intmax_t>(info.dataPosition), position + (result == TEE_SUCCESS ? 2 : 0));
  }
  ASSERT_EQ(TEE_SeekObjectData(object, 0, TEE_DATA_SEEK_SET), TEE_SUCCESS);
  EXPECT_EQ(read_all(object), std::string("012xy5678xy\0\0xy", 15));
}

TEST_F(persistent, an_object_can_be_stored_without_a_handle) {
  EXPECT_EQ(create_object(0, "first", nullptr), TEE_SUCCESS);
  EXPECT_EQ(create_object(0, "second", nullptr), TEE_ERROR_ACCESS_CONFLICT);
  ASSERT_EQ(open_object(READ, &object), TEE_SUCCESS);
  EXPECT_EQ(read_all(object), "first");
  EXPECT_EQ(create_object(OVERWRITE, "second", nullptr), TEE_ERROR_ACCESS_CONFLICT);
  TEE_CloseObject(object);
  EXPECT_EQ(owner.objects().size(), 0u);
}

TEST_F(persistent, names_do_not_lie_in_memory_of_the_client) {
  char memory[] = "id";
  call_parameters parameters{.types = TEE_PARAM_TYPE_MEMREF_INPUT};
  parameters.slots[0].memref = {memory, sizeof(memory)};
  instance_scope entered(owner, &parameters);
  EXPECT_DEATH((void)TEE_OpenPersistentObject(TEE_STORAGE_PRIVATE, memory + 2, 1, READ, &object),
               "panic: TEE_OpenPersistentObject: objectID is in memory of the client");
  EXPECT_EQ(TEE_OpenPersistentObject(TEE_STORAGE_PRIVATE, memory, 0, READ, &object),
            TEE_ERROR_ITEM_NOT_FOUND);
}

TEST_F(persistent, names_belong_to_storage_and_trusted_application) {
  ASSERT_EQ(create_object(READ, "", &object), TEE_SUCCESS);
  EXPECT_EQ(read_all(object), "");
  TEE_CloseObject(object);
  EXPECT_EQ(TEE_OpenPersistentObject(TEE_STORAGE_PRIVATE, "id", 2, READ, &object),
            TEE_ERROR_ITEM_NOT_FOUND);
  for (uint32_t storage_id : {0u, 2u, 0x80000000u, 0x80000001u}) {
    EXPECT_EQ(TEE_OpenPersistentObject(storage_id, "id", 3, READ, &object),
              TEE_ERROR_ITEM_NOT_FOUND);
  }
  instance stranger(STRANGER, *dev, HEAP_LIMIT);
  instance_scope other(stranger);
  EXPECT_EQ(open_object(READ, &object), TEE_ERROR_ITEM_NOT_FOUND);
  EXPECT_EQ(object, nullptr);
}

TEST_F(persistent, keys_and_deletion) {
  const std::string secret = "0123456789abcdef";
  TEE_ObjectHandle key = secret_key(TEE_TYPE_AES, {secret.begin(), secret.end()});
  ASSERT_EQ(
      TEE_CreatePersistentObject(TEE_STORAGE_PRIVATE, nullptr, 0, READ, key, "data", 4, &object),
      TEE_SUCCESS);
  TEE_CloseObject(object);
  TEE_CloseObject(key);
  EXPECT_EQ(content_of(made.file("storage.db")).find(secret), std::string::npos);

  ASSERT_EQ(TEE_OpenPersistentObject(TEE_STORAGE_PRIVATE, nullptr, 0, READ | META, &object),
            TEE_SUCCESS);
  TEE_ObjectInfo info;
  ASSERT_EQ(TEE_GetObjectInfo1(object, &info), TEE_SUCCESS);
  EXPECT_EQ(info.objectType, TEE_TYPE_AES);
  EXPECT_EQ(info.objectSize, 128u);
  std::string found(16, '\0');
  size_t length = found.size();
  ASSERT_EQ(TEE_GetObjectBufferAttribute(object, TEE_ATTR_SECRET_VALUE, found.data(), &length),
            TEE_SUCCESS);
  EXPECT_EQ(found, secret);
  EXPECT_EQ(read_all(object), "data");

  EXPECT_EQ(TEE_CloseAndDeletePersistentObject1(object), TEE_SUCCESS);
  EXPECT_EQ(TEE_CloseAndDeletePersistentObject1(nullptr), TEE_SUCCESS);
  EXPECT_EQ(TEE_OpenPersistentObject(TEE_STORAGE_PRIVATE, nullptr, 0, READ, &object),
            TEE_ERROR_ITEM_NOT_FOUND);

  // A deletion that fails closes the handle all the same.
  ASSERT_EQ(create_object(META, "x", &object), TEE_SUCCESS);
  host::fail_nth_call(1, TEE_ERROR_STORAGE_NOT_AVAILABLE);
  EXPECT_EQ(TEE_CloseAndDeletePersistentObject1(object), TEE_ERROR_STORAGE_NOT_AVAILABLE);
  host::clear_fault();
  EXPECT_EQ(owner.objects().size(), 0u);
  EXPECT_EQ(open_object(META, &object), TEE_SUCCESS);
}

TEST_F(persistent, stored_attributes_that_make_no_key_are_corrupt) {
  const crypto::attribute secret{TEE_ATTR_SECRET_VALUE, secret_bytes(16)};
  const crypto::attribute odd{TEE_ATTR_SECRET_VALUE, secret_bytes(5)};
  const crypto::attribute modulus{TEE_ATTR_RSA_MODULUS, secret_bytes(64)};
  const std::pair<uint32_t, std::vector<crypto::attribute>> rows[] = {
      {TEE_TYPE_AES + 0xFF, {secret}},  {TEE_TYPE_AES, {modulus}},         {TEE_TYPE_AES, {odd}},
      {TEE_TYPE_AES, {secret, secret}}, {TEE_TYPE_RSA_KEYPAIR, {modulus}},
  };
  for (const auto& [type, attributes] : rows) {
    stored_object content;
    content.type = type;
    content.max_bits = 512;
    content.attributes = attributes;
    dev->objects().save({TEE_STORAGE_PRIVATE, to_bytes(OWNER), {'i', 'd', 0}}, encode(content));
    EXPECT_EQ(open_object(READ, &object), TEE_ERROR_CORRUPT_OBJECT) << type;
  }
  EXPECT_EQ(owner.objects().size(), 0u);
}

TEST_F(persistent, content_of_another_form_is_no_object) {
  stored_object content;
  content.type = TEE_TYPE_AES;
  content.attributes = {{TEE_ATTR_SECRET_VALUE, secret_bytes(16)}};
  const secret_bytes good = encode(content);
  ASSERT_TRUE(decode(good));
  for (size_t length = 0; length < good.size(); length++)
    EXPECT_FALSE(decode(std::span(good).first(length))) << length;
  // The version, the number of attributes, the secret's length.
  for (size_t place : {size_t{0}, size_t{16}, good.size() - 20, good.size() - 17}) {
    secret_bytes lying = good;
    lying[place] += 1;
    EXPECT_FALSE(decode(lying)) << place;
  }
}

using persistent_death = persistent;

TEST_F(persistent_death, programming_errors_panic) {
  ASSERT_EQ(create_object(READ, "data", &object), TEE_SUCCESS);
  TEE_ObjectHandle transient = nullptr;
  ASSERT_EQ(TEE_AllocateTransientObject(TEE_TYPE_AES, 128, &transient), TEE_SUCCESS);
  const std::string long_id(65, 'i');
  size_t count = 0;
  char byte = 0;
  EXPECT_DEATH(TEE_WriteObjectData(object, "x", 1), "panic: TEE_WriteObjectData: .*right");
  EXPECT_DEATH(TEE_CloseAndDeletePersistentObject1(object), "panic: .*right");
  EXPECT_DEATH(TEE_ReadObjectData(transient, &byte, 1, &count), "panic: .*not persistent");
  EXPECT_DEATH(TEE_ReadObjectData(object, nullptr, 1, &count), "panic: .*null");
  EXPECT_DEATH(open_object(OVERWRITE, &second), "panic: .*flags");
  EXPECT_DEATH(TEE_OpenPersistentObject(1, long_id.data(), 65, READ, &second), "panic: .*65");
  EXPECT_DEATH(TEE_CreatePersistentObject(1, "k", 1, 0, transient, nullptr, 0, &second),
               "panic: .*uninitialised");
  TEE_CloseObject(object);
  EXPECT_DEATH(TEE_SeekObjectData(object, 0, TEE_DATA_SEEK_SET), "panic: .*not valid");
}

}  // namespace
}  // namespace tee::test
