// Key blobs: sealing and opening.
#include "ta/store/key_blob.h"

#include "tee_internal_api.h"

#include "ta/base/tee_handles.h"
#include "ta/params/marshal.h"
#include "ta/store/blob_plaintext.h"
#include "ta/store/key_store.h"

namespace keymaster {
namespace {

constexpr uint8_t PROTECTED_BY_DERIVED_KSK = 0;
constexpr uint8_t PROTECTED_BY_RPMB_KSK = 1;
constexpr uint32_t KK_BITS = 256;
constexpr size_t SALT_OFFSET = 1;
constexpr size_t NONCE_OFFSET = SALT_OFFSET + SALT_SIZE;
constexpr size_t NONCE_SIZE = 12;
constexpr size_t TAG_OFFSET = NONCE_OFFSET + NONCE_SIZE;
constexpr size_t TAG_SIZE = 16;
constexpr size_t HEADER_SIZE = TAG_OFFSET + TAG_SIZE;
static_assert(HEADER_SIZE == 93);

// The cipher of a blob: AES-256-GCM under the key that `ksk` and the blob's salt give.
TEE_Result start_gcm(byte_view header, TEE_ObjectHandle ksk, uint32_t mode, tee_operation* gcm) {
  tee_object kk;
  TRY(checked(TEE_DeriveKK(ksk, header.subspan(SALT_OFFSET, SALT_SIZE), &kk), "DeriveKK"));
  TRY(gcm->allocate(TEE_ALG_AES_GCM, mode, KK_BITS));
  TRY(gcm->set_key(kk.get()));
  return gcm->ae_init(header.subspan(NONCE_OFFSET, NONCE_SIZE), TAG_SIZE * 8);
}

// Encrypts the pieces of the plaintext one behind the other into `ciphertext`.
TEE_Result encrypt_pieces(tee_operation* gcm, std::span<const byte_view> pieces,
                          output_cursor* ciphertext) {
  for (const byte_view piece : pieces) {
    size_t produced = 0;
    byte_span room;
    TRY(gcm->ae_update(piece, ciphertext->rest(), &produced));
    if (!ciphertext->reserve(produced, &room)) return TEE_ERROR_GENERIC;
  }
  return TEE_SUCCESS;
}

TEE_Result finish_encryption(tee_operation* gcm, byte_span tag, output_cursor* ciphertext) {
  const byte_span last = ciphertext->rest();
  tee_size last_size = static_cast<tee_size>(last.size());
  tee_size tag_size = static_cast<tee_size>(tag.size());
  TRY(checked(
      TEE_AEEncryptFinal(gcm->get(), nullptr, 0, last.data(), &last_size, tag.data(), &tag_size),
      "AEEncryptFinal"));
  if (tag_size != TAG_SIZE) {
    // The second number is the final call's output, not the tag's size: intended.
    return fail(TEE_ERROR_GENERIC, "Wrong tag size, expect %dB, got %dB",
                static_cast<int>(TAG_SIZE), static_cast<int>(last_size));
  }
  byte_span room;
  return ciphertext->reserve(last_size, &room) ? TEE_SUCCESS : TEE_ERROR_GENERIC;
}

// Fills a blob of exactly the right size, in TA memory.
TEE_Result seal(byte_view key, byte_view characteristics, byte_span blob) {
  const byte_span salt = blob.subspan(SALT_OFFSET, SALT_SIZE);
  const byte_span nonce = blob.subspan(NONCE_OFFSET, NONCE_SIZE);
  TEE_GenerateRandom(salt.data(), static_cast<tee_size>(salt.size()));
  TEE_GenerateRandom(nonce.data(), static_cast<tee_size>(nonce.size()));
  const bool rpmb = rpmb_ksk() != TEE_HANDLE_NULL;
  blob[0] = rpmb ? PROTECTED_BY_RPMB_KSK : PROTECTED_BY_DERIVED_KSK;

  tee_operation gcm;
  TRY(start_gcm(blob, rpmb ? rpmb_ksk() : derived_ksk(), TEE_MODE_ENCRYPT, &gcm));
  uint8_t key_length[4];
  uint8_t characteristics_length[4];
  store_u32(key_length, static_cast<uint32_t>(key.size()));
  store_u32(characteristics_length, static_cast<uint32_t>(characteristics.size()));
  const byte_view pieces[] = {key_length, key, characteristics_length, characteristics};
  output_cursor ciphertext(blob.subspan(HEADER_SIZE));
  TRY(encrypt_pieces(&gcm, pieces, &ciphertext));
  TRY(finish_encryption(&gcm, blob.subspan(TAG_OFFSET, TAG_SIZE), &ciphertext));
  if (ciphertext.left() == 0) return TEE_SUCCESS;
  return fail(TEE_ERROR_GENERIC, "Unmatched total size, expected: %d actual: %d\n",
              static_cast<int>(blob.size()), static_cast<int>(blob.size() - ciphertext.left()));
}

// The KSK that a blob names.
outcome choose_ksk(uint8_t protection, TEE_ObjectHandle* ksk) {
  switch (protection) {
    case PROTECTED_BY_DERIVED_KSK:
      *ksk = derived_ksk();
      return DONE;
    case PROTECTED_BY_RPMB_KSK:
      *ksk = rpmb_ksk();
      if (*ksk != TEE_HANDLE_NULL) return DONE;
      return fail(KEY_STORE_ERROR_KSK_MISSING, "RPMB KSK died, fail to open key");
    default:
      return refuse(KM_ERROR_INVALID_KEY_BLOB, "Unknown key protection");
  }
}

// Decrypts and authenticates; *produced receives the bytes that both calls gave.
TEE_Result decrypt(tee_operation* gcm, byte_view ciphertext, byte_view tag, byte_span plaintext,
                   size_t* produced) {
  size_t updated = 0;
  TRY(gcm->ae_update(ciphertext, plaintext, &updated));
  const byte_span last = plaintext.subspan(updated);
  tee_size last_size = static_cast<tee_size>(last.size());
  TRY(checked(
      TEE_AEDecryptFinal(gcm->get(), nullptr, 0, last.data(), &last_size,
                         const_cast<uint8_t*>(tag.data()), static_cast<tee_size>(tag.size())),
      "AEDecryptFinal"));
  *produced = updated + last_size;
  return TEE_SUCCESS;
}

// Decrypts the blob into *plaintext.
outcome unseal(byte_view blob, heap_buffer* plaintext) {
  TEE_ObjectHandle ksk{};
  TRY(choose_ksk(blob[0], &ksk));
  tee_operation gcm;
  TRY(start_gcm(blob, ksk, TEE_MODE_DECRYPT, &gcm));
  const byte_view ciphertext = blob.subspan(HEADER_SIZE);
  if (!plaintext->allocate(ciphertext.size())) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  size_t produced = 0;
  TRY(decrypt(&gcm, ciphertext, blob.subspan(TAG_OFFSET, TAG_SIZE), plaintext->span(), &produced));
  if (produced == ciphertext.size()) return DONE;
  return refuse(KM_ERROR_UNKNOWN_ERROR, "Too short output of AES, expect %dB, got %dB",
                static_cast<int>(ciphertext.size()), static_cast<int>(produced));
}

}  // namespace

outcome parse_plaintext(heap_buffer* plaintext, keymaster_error_t unreadable_set,
                        keymaster_key_param_set_t* characteristics) {
  input_cursor in(plaintext->view());
  byte_view key;
  byte_view marshalled;
  if (!in.read_field(&key) || !in.read_field(&marshalled)) {
    return fail(TEE_ERROR_GENERIC, "Too short input");
  }
  if (unmarshal(marshalled, characteristics) != TEE_SUCCESS) {
    return refuse(unreadable_set, "Unmarshal failed");
  }
  plaintext->keep(key);
  return DONE;
}

TEE_Result save_key(byte_view key, const keymaster_key_param_set_t& characteristics, byte_span blob,
                    size_t* blob_size) {
  const trace_scope scope;
  *blob_size = 0;
  uint8_t* marshalled = nullptr;
  uint32_t marshalled_size = 0;
  if (TEE_Result res = marshal(characteristics, true, &marshalled, &marshalled_size)) {
    return fail(res, "Marshal failed");
  }
  const heap_buffer owner(marshalled, marshalled_size);
  const uint64_t size = uint64_t{HEADER_SIZE} + 2 * sizeof(uint32_t) + key.size() + owner.size();
  if (size > blob.size()) return fail(TEE_ERROR_SHORT_BUFFER, "Too short key blob");
  heap_buffer sealed;
  if (!sealed.allocate(static_cast<size_t>(size))) {
    return fail(TEE_ERROR_OUT_OF_MEMORY, "Out of memory");
  }
  TRY(seal(key, owner.view(), sealed.span()));
  copy_bytes(blob, sealed.view());
  *blob_size = sealed.size();
  return TEE_SUCCESS;
}

outcome open_key(byte_view blob, heap_buffer* key, keymaster_key_param_set_t* characteristics) {
  const trace_scope scope;
  key->reset();
  *characteristics = {};
  if (blob.size() <= HEADER_SIZE) return refuse(KM_ERROR_INVALID_KEY_BLOB, "Too short key blob");
  heap_buffer plaintext;
  TRY(unseal(blob, &plaintext));
  TRY(parse_plaintext(&plaintext, KM_ERROR_INVALID_ARGUMENT, characteristics));
  *key = std::move(plaintext);
  return DONE;
}

}  // namespace keymaster
