// The key storage keys.
#include "ta/store/key_store.h"

#include <cstring>

#include "product/values.h"
#include "ta/base/heap.h"
#include "ta/base/results.h"

namespace keymaster {
namespace {

constexpr uint32_t KSK_BITS = KSK_SIZE * 8;
// With its terminating zero, which is part of the identifier.
constexpr char KSK_OBJECT_ID[] = "Keymaster KSK";
static_assert(sizeof(KSK_OBJECT_ID) == 14);

// Plain handles: nothing frees them before the instance ends, and a new instance overwrites
// whatever an earlier one left here.
TEE_ObjectHandle rpmb_ksk_handle;
TEE_ObjectHandle derived_ksk_handle;

// Makes the HMAC object of a KSK from its bytes.
TEE_Result load_ksk(byte_view secret, tee_object* ksk) {
  const TEE_Attribute attribute = ref_attribute(TEE_ATTR_SECRET_VALUE, secret);
  if (TEE_Result res = ksk->allocate(TEE_TYPE_HMAC_SHA256, KSK_BITS)) return res;
  return ksk->populate({&attribute, 1});
}

TEE_Result key_store_init_derived_ksk() {
  const trace_scope scope;
  uint8_t input[KSK_SIZE];
  memset(input, DERIVED_KSK_FILL_BYTE, sizeof(input));
  TEE_UUID device{};
  if (TEE_Result res =
          TEE_GetPropertyAsUUID(TEE_PROPSET_TEE_IMPLEMENTATION, "gpd.tee.deviceID", &device)) {
    return TEE_FAIL(res, "GetPropertyAsUUID failed with 0x%08x\n", res);
  }
  static_assert(sizeof(device) == 16);
  // As it lies in memory: blobs depend on it.
  copy_bytes(input, object_bytes(std::as_const(device)));
  tee_object ksk;
  const TEE_Result res = load_ksk(input, &ksk);
  wipe(input);
  if (res == TEE_SUCCESS) derived_ksk_handle = ksk.release();
  return res;
}

// Whether the TEE has an RPMB file system; makes it when there is none yet.
bool judge_rpmb() {
  const trace_scope scope;
  uint32_t state = 0;
  const TEE_Result res = TEE_RPMB_MakeFileSystem(&state);
  if (res != TEE_SUCCESS) TRACE_ERROR("TEE_RPMB_MakeFileSystem return 0x%08x", res);
  return res == TEE_SUCCESS;
}

TEE_Result open_ksk_object(uint32_t flags, tee_object* object) {
  return TEE_OpenPersistentObject(TEE_STORAGE_RPMB, KSK_OBJECT_ID, sizeof(KSK_OBJECT_ID), flags,
                                  object->receive());
}

// The first start on a device with RPMB: generates the KSK and stores it.
TEE_Result create_rpmb_ksk(tee_object* ksk) {
  if (TEE_Result res = ksk->allocate(TEE_TYPE_HMAC_SHA256, KSK_BITS)) return res;
  if (TEE_Result res = ksk->generate(KSK_BITS, {})) return res;
  heap_buffer secret;
  if (!secret.allocate(KSK_SIZE)) {
    trace_error("Out of memory");
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  size_t length = 0;
  if (TEE_Result res = ksk->read_attribute(TEE_ATTR_SECRET_VALUE, secret.span(), &length)) {
    return res;
  }
  if (length != KSK_SIZE) {
    trace_error("Wrong key size, expected %dB, got %dB", static_cast<int>(KSK_SIZE),
                static_cast<int>(length));
    return TEE_ERROR_GENERIC;
  }
  tee_object stored;
  const TEE_Result res = TEE_CreatePersistentObject(
      TEE_STORAGE_RPMB, KSK_OBJECT_ID, sizeof(KSK_OBJECT_ID), TEE_DATA_FLAG_ACCESS_READ,
      TEE_HANDLE_NULL, secret.data(), KSK_SIZE, stored.receive());
  if (res != TEE_SUCCESS) {
    trace_error("CreatePersistentObject failed with 0x%08x\n", res);
  }
  return res;
}

// A stored KSK of another length is of no use. Deletes it and fails this creation; the next one
// finds no object and makes a new KSK. That it takes two starts is intended: the failure is seen.
TEE_Result delete_wrong_ksk(tee_object* stored, size_t length) {
  trace_error("Wrong persistent data length, expected %dB, got %dB", static_cast<int>(KSK_SIZE),
              static_cast<int>(length));
  trace_error("Now, delete the key and recreate it, but all previous keymaster key will die");
  stored->reset();  // still open, it would conflict with the access that deletes
  if (TEE_Result res = open_ksk_object(TEE_DATA_FLAG_ACCESS_WRITE_META, stored)) {
    trace_error("OpenPersistentObject failed with 0x%08x\n", res);
    return res;
  }
  if (TEE_Result res = TEE_CloseAndDeletePersistentObject1(stored->release())) {
    trace_error("CloseAndDeletePersistentObject failed with 0x%08x\n", res);
    return res;
  }
  return KEY_STORE_ERROR_KSK_DELETED;
}

TEE_Result load_rpmb_ksk(tee_object* stored, tee_object* ksk) {
  // One byte more than expected, so that a stream that is too long is seen.
  uint8_t secret[KSK_SIZE + 1];
  tee_size length = 0;
  TEE_Result res = TEE_ReadObjectData(stored->get(), secret, sizeof(secret), &length);
  if (res != TEE_SUCCESS) {
    trace_error("ReadObjectData failed with 0x%08x\n", res);
  } else if (length != KSK_SIZE) {
    res = delete_wrong_ksk(stored, length);
  } else {
    res = load_ksk(byte_view(secret).first(KSK_SIZE), ksk);
  }
  wipe(secret);
  return res;
}

TEE_Result key_store_init_rpmb_ksk() {
  const trace_scope scope;
  tee_object stored;
  tee_object ksk;
  TEE_Result res = open_ksk_object(TEE_DATA_FLAG_ACCESS_READ, &stored);
  if (res == TEE_ERROR_ITEM_NOT_FOUND) {
    res = create_rpmb_ksk(&ksk);
  } else if (res != TEE_SUCCESS) {
    trace_error("Open KSK failed with 0x%08x\n", res);
  } else {
    res = load_rpmb_ksk(&stored, &ksk);
  }
  if (res == TEE_SUCCESS) rpmb_ksk_handle = ksk.release();
  return res;
}

}  // namespace

TEE_Result key_store_init() {
  const trace_scope scope;
  rpmb_ksk_handle = TEE_HANDLE_NULL;
  derived_ksk_handle = TEE_HANDLE_NULL;
  if (TEE_Result res = key_store_init_derived_ksk()) {
    return TEE_FAIL(res, "Init derived KSK failed with 0x%08x", res);
  }
  if (!judge_rpmb()) {
    TRACE_INFO("no RPMB for ksk\n");
    return TEE_SUCCESS;
  }
  if (TEE_Result res = key_store_init_rpmb_ksk()) {
    return TEE_FAIL(res, "Init RPMB KSK failed with 0x%08x", res);
  }
  return TEE_SUCCESS;
}

TEE_ObjectHandle rpmb_ksk() {
  return rpmb_ksk_handle;
}

TEE_ObjectHandle derived_ksk() {
  return derived_ksk_handle;
}

TEE_Result TEE_DeriveKK(TEE_ObjectHandle ksk, byte_view salt, tee_object* out_key) {
  const trace_scope scope;
  tee_operation hmac;
  if (TEE_Result res = hmac.allocate(TEE_ALG_HMAC_SHA256, TEE_MODE_MAC, KSK_BITS)) return res;
  if (TEE_Result res = hmac.set_key(ksk)) return res;
  TEE_MACInit(hmac.get(), nullptr, 0);
  uint8_t mac[KSK_SIZE];
  size_t length = 0;
  if (TEE_Result res = hmac.mac_final(salt, mac, &length)) return res;
  if (length != KSK_SIZE) {
    wipe(mac);
    return TEE_FAIL(TEE_ERROR_BAD_PARAMETERS, "Wrong MAC length, expected %dB, got %dB\n",
                    static_cast<int>(KSK_SIZE), static_cast<int>(length));
  }
  const TEE_Attribute secret = ref_attribute(TEE_ATTR_SECRET_VALUE, mac);
  tee_object key;
  TEE_Result res = key.allocate(TEE_TYPE_AES, KSK_BITS);
  if (res == TEE_SUCCESS) res = key.populate({&secret, 1});
  wipe(mac);
  if (res == TEE_SUCCESS) *out_key = std::move(key);
  return res;
}

}  // namespace keymaster
