// The key storage keys.
#include "ta/store/key_store.h"

#include "product/values.h"
#include "ta/base/heap.h"
#include "ta/base/outcome.h"

namespace keymaster {
namespace {

constexpr uint32_t KSK_BITS = KSK_SIZE * 8;
// With its terminating zero, which is part of the identifier.
constexpr char KSK_OBJECT_ID[] = "Keymaster KSK";
static_assert(sizeof(KSK_OBJECT_ID) == 14);

// Plain handles, freed when the instance ends; a new instance overwrites whatever an earlier one
// left here.
TEE_ObjectHandle rpmb_ksk_handle;
TEE_ObjectHandle derived_ksk_handle;

// Makes the HMAC object of a KSK from its bytes.
TEE_Result load_ksk(byte_view secret, tee_object* ksk) {
  const TEE_Attribute attribute = ref_attribute(TEE_ATTR_SECRET_VALUE, secret);
  TRY(ksk->allocate(TEE_TYPE_HMAC_SHA256, KSK_BITS));
  return ksk->populate({&attribute, 1});
}

TEE_Result key_store_init_derived_ksk() {
  const trace_scope scope;
  secret_bytes<KSK_SIZE> input;
  input.fill(DERIVED_KSK_FILL_BYTE);
  TEE_UUID device{};
  TRY(checked(TEE_GetPropertyAsUUID(TEE_PROPSET_TEE_IMPLEMENTATION, "gpd.tee.deviceID", &device),
              "GetPropertyAsUUID"));
  static_assert(sizeof(device) == 16);
  // As it lies in memory: blobs depend on it.
  copy_bytes(input, object_bytes(std::as_const(device)));
  tee_object ksk;
  TRY(load_ksk(input, &ksk));
  derived_ksk_handle = ksk.release();
  return TEE_SUCCESS;
}

// Whether the TEE has an RPMB file system; makes it when there is none yet.
bool judge_rpmb() {
  const trace_scope scope;
  uint32_t state = 0;
  const TEE_Result res = TEE_RPMB_MakeFileSystem(&state);
  if (res != TEE_SUCCESS) trace(TEE_TRACE_ERROR, "TEE_RPMB_MakeFileSystem return 0x%08x", res);
  return res == TEE_SUCCESS;
}

TEE_Result open_ksk_object(uint32_t flags, tee_object* object) {
  return TEE_OpenPersistentObject(TEE_STORAGE_RPMB, KSK_OBJECT_ID, sizeof(KSK_OBJECT_ID), flags,
                                  object->receive());
}

// The first start on a device with RPMB: generates the KSK and stores it.
TEE_Result create_rpmb_ksk(tee_object* ksk) {
  TRY(ksk->allocate(TEE_TYPE_HMAC_SHA256, KSK_BITS));
  TRY(ksk->generate(KSK_BITS, {}));
  heap_buffer secret;
  if (!secret.allocate(KSK_SIZE)) return fail(TEE_ERROR_OUT_OF_MEMORY, "Out of memory");
  size_t length = 0;
  TRY(ksk->read_attribute(TEE_ATTR_SECRET_VALUE, secret.span(), &length));
  if (length != KSK_SIZE) {
    return fail(TEE_ERROR_GENERIC, "Wrong key size, expected %dB, got %dB",
                static_cast<int>(KSK_SIZE), static_cast<int>(length));
  }
  tee_object stored;
  return checked(TEE_CreatePersistentObject(TEE_STORAGE_RPMB, KSK_OBJECT_ID, sizeof(KSK_OBJECT_ID),
                                            TEE_DATA_FLAG_ACCESS_READ, TEE_HANDLE_NULL,
                                            secret.data(), KSK_SIZE, stored.receive()),
                 "CreatePersistentObject");
}

// A stored KSK of another length is of no use. Deletes it and fails this creation; the next one
// finds no object and makes a new KSK. That it takes two starts is intended: the failure is seen.
TEE_Result delete_wrong_ksk(tee_object* stored, size_t length) {
  trace(TEE_TRACE_ERROR, "Wrong persistent data length, expected %dB, got %dB",
        static_cast<int>(KSK_SIZE), static_cast<int>(length));
  trace(TEE_TRACE_ERROR,
        "Now, delete the key and recreate it, but all previous keymaster key will die");
  stored->reset();  // still open, it would conflict with the access that deletes
  TRY(checked(open_ksk_object(TEE_DATA_FLAG_ACCESS_WRITE_META, stored), "OpenPersistentObject"));
  TRY(checked(TEE_CloseAndDeletePersistentObject1(stored->release()),
              "CloseAndDeletePersistentObject"));
  return KEY_STORE_ERROR_KSK_DELETED;
}

// How long a stored KSK is, of which `read` bytes fit the buffer.
size_t stored_length(const tee_object& stored, size_t read) {
  TEE_ObjectInfo info{};
  return TEE_GetObjectInfo1(stored.get(), &info) == TEE_SUCCESS ? info.dataSize : read;
}

TEE_Result load_rpmb_ksk(tee_object* stored, tee_object* ksk) {
  // One byte more than expected, so that a stream that is too long is seen.
  secret_bytes<KSK_SIZE + 1> secret;
  tee_size length = 0;
  TRY(checked(TEE_ReadObjectData(stored->get(), secret.data(), secret.size(), &length),
              "ReadObjectData"));
  if (length != KSK_SIZE) return delete_wrong_ksk(stored, stored_length(*stored, length));
  return load_ksk(byte_view(secret).first(KSK_SIZE), ksk);
}

TEE_Result key_store_init_rpmb_ksk() {
  const trace_scope scope;
  tee_object stored;
  tee_object ksk;
  const TEE_Result opened = open_ksk_object(TEE_DATA_FLAG_ACCESS_READ, &stored);
  if (opened == TEE_ERROR_ITEM_NOT_FOUND) {
    TRY(create_rpmb_ksk(&ksk));
  } else {
    TRY(checked(opened, "Open KSK"));
    TRY(load_rpmb_ksk(&stored, &ksk));
  }
  rpmb_ksk_handle = ksk.release();
  return TEE_SUCCESS;
}

}  // namespace

TEE_Result key_store_init() {
  const trace_scope scope;
  rpmb_ksk_handle = TEE_HANDLE_NULL;
  derived_ksk_handle = TEE_HANDLE_NULL;
  if (TEE_Result res = key_store_init_derived_ksk()) {
    return fail(res, "Init derived KSK failed with 0x%08x", res);
  }
  if (!judge_rpmb()) {
    trace(TEE_TRACE_INFO, "no RPMB for ksk\n");
    return TEE_SUCCESS;
  }
  if (TEE_Result res = key_store_init_rpmb_ksk()) {
    return fail(res, "Init RPMB KSK failed with 0x%08x", res);
  }
  return TEE_SUCCESS;
}

void key_store_destroy() {
  for (TEE_ObjectHandle* ksk : {&rpmb_ksk_handle, &derived_ksk_handle}) {
    TEE_FreeTransientObject(std::exchange(*ksk, TEE_ObjectHandle{}));  // null is legal
  }
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
  TRY(hmac.allocate(TEE_ALG_HMAC_SHA256, TEE_MODE_MAC, KSK_BITS));
  TRY(hmac.set_key(ksk));
  TEE_MACInit(hmac.get(), nullptr, 0);
  secret_bytes<KSK_SIZE> mac;
  size_t length = 0;
  TRY(hmac.mac_final(salt, mac, &length));
  if (length != KSK_SIZE) {
    return fail(TEE_ERROR_BAD_PARAMETERS, "Wrong MAC length, expected %dB, got %dB\n",
                static_cast<int>(KSK_SIZE), static_cast<int>(length));
  }
  const TEE_Attribute secret = ref_attribute(TEE_ATTR_SECRET_VALUE, mac);
  tee_object key;
  TRY(key.allocate(TEE_TYPE_AES, KSK_BITS));
  TRY(key.populate({&secret, 1}));
  *out_key = std::move(key);
  return TEE_SUCCESS;
}

}  // namespace keymaster
