// The key material of asymmetric keys.
#include "ta/alg/key_record.h"

#include <array>

#include "ta/base/results.h"

namespace keymaster {
namespace {

constexpr size_t MAX_NUMBERS = 8;

using number_lengths = std::array<size_t, MAX_NUMBERS>;

// Asks the platform for the length of every number. Both results.
TEE_Result measure(const tee_object& key, std::span<const uint32_t> ids, size_t longest,
                   number_lengths* lengths, keymaster_error_t* km_error) {
  heap_buffer scratch;
  if (!scratch.allocate(longest)) {
    trace_error("Out of memory");
    *km_error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  for (size_t i = 0; i < ids.size(); i++) {
    if (TEE_Result res = key.read_attribute(ids[i], scratch.span(), &(*lengths)[i])) return res;
  }
  return TEE_SUCCESS;
}

// Reads one number of `length` bytes straight into the record. Both results.
TEE_Result write_number(const tee_object& key, uint32_t id, size_t length, output_cursor* out,
                        keymaster_error_t* km_error) {
  byte_span room;
  if (!out->write_u32(static_cast<uint32_t>(length)) || !out->reserve(length, &room)) {
    trace_error("Too short buffer");
    return TEE_ERROR_GENERIC;
  }
  size_t written = 0;
  if (TEE_Result res = key.read_attribute(id, room, &written)) return res;
  if (written != length) {
    trace_error("Buffer size modified, before %dB, after %dB", static_cast<int>(length),
                static_cast<int>(written));
    *km_error = KM_ERROR_UNKNOWN_ERROR;
  }
  return TEE_SUCCESS;
}

TEE_Result write_record(const tee_object& key, uint32_t key_bits, std::span<const uint32_t> ids,
                        size_t longest, heap_buffer* record, keymaster_error_t* km_error) {
  number_lengths lengths{};
  TEE_Result res = measure(key, ids, longest, &lengths, km_error);
  if (failed(res, *km_error)) return res;
  size_t size = sizeof(uint32_t);
  for (size_t i = 0; i < ids.size(); i++)
    size += sizeof(uint32_t) + lengths[i];
  if (!record->allocate(size)) {
    trace_error("Out of memory");
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  store_u32(record->span(), key_bits);
  output_cursor out(record->span().subspan(sizeof(uint32_t)));
  for (size_t i = 0; i < ids.size(); i++) {
    res = write_number(key, ids[i], lengths[i], &out, km_error);
    if (failed(res, *km_error)) return res;
  }
  return TEE_SUCCESS;
}

}  // namespace

TEE_Result generate_key_record(uint32_t object_type, uint32_t key_bits,
                               const TEE_Attribute& parameter, std::span<const uint32_t> ids,
                               size_t longest, heap_buffer* record, keymaster_error_t* km_error) {
  tee_object key;
  TEE_Result res = key.allocate(object_type, key_bits);
  if (res == TEE_SUCCESS) res = key.generate(key_bits, {&parameter, 1});
  if (res != TEE_SUCCESS) {
    *km_error = KM_ERROR_UNKNOWN_ERROR;
    return res;
  }
  heap_buffer built;
  res = write_record(key, key_bits, ids, longest, &built, km_error);
  if (!failed(res, *km_error)) *record = std::move(built);
  return res;
}

bool read_numbers(input_cursor* in, std::span<byte_view> numbers) {
  for (byte_view& number : numbers) {
    if (!in->read_field(&number)) return false;
  }
  return true;
}

bool read_attributes(byte_view key_material, std::span<const uint32_t> ids, uint32_t* key_bits,
                     std::span<TEE_Attribute> attributes) {
  input_cursor in(key_material);
  if (!in.read_u32(key_bits)) return false;
  for (size_t i = 0; i < ids.size(); i++) {
    byte_view number;
    if (!in.read_field(&number)) return false;
    attributes[i] = ref_attribute(ids[i], number);
  }
  return true;
}

TEE_Result load_key(uint32_t object_type, uint32_t key_bits,
                    std::span<const TEE_Attribute> attributes, tee_object* key) {
  tee_object loaded;
  if (TEE_Result res = loaded.allocate(object_type, key_bits)) return res;
  if (TEE_Result res = loaded.populate(attributes)) return res;
  *key = std::move(loaded);
  return TEE_SUCCESS;
}

}  // namespace keymaster
