// What the stand-ins for sibling trusted applications share: memory that wipes itself, and the
// question who is calling.
#pragma once

#include "tee_internal_api.h"

#include <cstddef>
#include <cstdint>
#include <cstring>

#include "product/uuids.h"

namespace peers {

// wipe: overwrites the bytes with zeros in a way that the compiler keeps.
inline void wipe(uint8_t* bytes, size_t length) {
  volatile uint8_t* target = bytes;
  while (length-- > 0)
    *target++ = 0;
}

// load_u32: the first four bytes as a little-endian number.
inline uint32_t load_u32(const uint8_t* from) {
  return from[0] | uint32_t{from[1]} << 8 | uint32_t{from[2]} << 16 | uint32_t{from[3]} << 24;
}

// store_little_endian: the `length` low bytes of `value`.
inline void store_little_endian(uint8_t* out, uint64_t value, size_t length) {
  for (size_t i = 0; i < length; i++, value >>= 8)
    out[i] = static_cast<uint8_t>(value);
}

// block: bytes on the TEE's heap, wiped before they are freed.
class block {
 public:
  block() = default;
  block(const block&) = delete;
  block& operator=(const block&) = delete;
  ~block() {
    if (data_ != nullptr) wipe(data_, size_);
    TEE_Free(data_);
  }

  // Zero-filled; once. TEE_ERROR_OUT_OF_MEMORY. A block of 0 bytes is legal.
  [[nodiscard]] TEE_Result allocate(size_t size) {
    data_ = static_cast<uint8_t*>(TEE_Malloc(size == 0 ? 1 : size, TEE_MALLOC_FILL_ZERO));
    if (data_ == nullptr) return TEE_ERROR_OUT_OF_MEMORY;
    size_ = size;
    return TEE_SUCCESS;
  }
  // A copy of a client's buffer, which the client may still be writing to.
  [[nodiscard]] TEE_Result copy_of(const void* bytes, size_t size) {
    if (TEE_Result res = allocate(size)) return res;
    if (size != 0) memcpy(data_, bytes, size);
    return TEE_SUCCESS;
  }
  // The whole data of an open object.
  [[nodiscard]] TEE_Result read_object(TEE_ObjectHandle object) {
    TEE_ObjectInfo info;
    if (TEE_Result res = TEE_GetObjectInfo1(object, &info)) return res;
    if (TEE_Result res = allocate(info.dataSize)) return res;
    size_t count = 0;
    if (TEE_Result res = TEE_ReadObjectData(object, data_, size_, &count)) return res;
    return count == size_ ? TEE_SUCCESS : TEE_ERROR_BAD_STATE;
  }

  uint8_t* data() { return data_; }
  size_t size() const { return size_; }

 private:
  uint8_t* data_ = nullptr;
  size_t size_ = 0;
};

// require_keymaster: TEE_SUCCESS when the client of this call is the Keymaster TA, else
// TEE_ERROR_ACCESS_DENIED. Keys and secrets go to nobody else.
[[nodiscard]] inline TEE_Result require_keymaster() {
  constexpr TEE_UUID KEYMASTER = KEYMASTER_TA_UUID;
  TEE_Identity client;
  TEE_Result res =
      TEE_GetPropertyAsIdentity(TEE_PROPSET_CURRENT_CLIENT, "gpd.client.identity", &client);
  if (res != TEE_SUCCESS) return res;
  const bool is_keymaster = client.login == TEE_LOGIN_TRUSTED_APP &&
                            client.uuid.timeLow == KEYMASTER.timeLow &&
                            client.uuid.timeMid == KEYMASTER.timeMid &&
                            client.uuid.timeHiAndVersion == KEYMASTER.timeHiAndVersion &&
                            memcmp(client.uuid.clockSeqAndNode, KEYMASTER.clockSeqAndNode,
                                   sizeof(KEYMASTER.clockSeqAndNode)) == 0;
  return is_keymaster ? TEE_SUCCESS : TEE_ERROR_ACCESS_DENIED;
}

}  // namespace peers
