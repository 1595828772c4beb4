// The key material of asymmetric keys.
#include "ta/alg/key_record.h"

#include <array>

#include "ta/alg/big_endian.h"

namespace keymaster {
namespace {

constexpr size_t MAX_NUMBERS = 8;

using number_lengths = std::array<size_t, MAX_NUMBERS>;

// Asks the platform for the length of every number.
outcome measure(const tee_object& key, const key_form& form, number_lengths* lengths) {
  heap_buffer scratch;
  if (!scratch.allocate(form.longest)) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  for (size_t i = 0; i < form.ids.size(); i++)
    TRY(key.read_attribute(form.ids[i], scratch.span(), &(*lengths)[i]));
  return DONE;
}

// Reads one number of `length` bytes straight into the record.
outcome write_number(const tee_object& key, uint32_t id, size_t length, output_cursor* out) {
  byte_span room;
  if (!out->write_u32(static_cast<uint32_t>(length)) || !out->reserve(length, &room)) {
    return fail(TEE_ERROR_GENERIC, "Too short buffer");
  }
  size_t written = 0;
  TRY(key.read_attribute(id, room, &written));
  if (written == length) return DONE;
  return refuse(KM_ERROR_UNKNOWN_ERROR, "Buffer size modified, before %dB, after %dB",
                static_cast<int>(length), static_cast<int>(written));
}

}  // namespace

outcome generate_key_record(const key_form& form, const TEE_Attribute& parameter,
                            heap_buffer* record) {
  tee_object key;
  TEE_Result res = key.allocate(form.object_type, form.key_bits);
  if (res == TEE_SUCCESS) res = key.generate(form.key_bits, {&parameter, 1});
  if (res != TEE_SUCCESS) return {res, KM_ERROR_UNKNOWN_ERROR};
  number_lengths lengths{};
  TRY(measure(key, form, &lengths));
  size_t size = sizeof(uint32_t);
  for (size_t i = 0; i < form.ids.size(); i++)
    size += sizeof(uint32_t) + lengths[i];
  heap_buffer built;
  if (!built.allocate(size)) return fail(TEE_ERROR_OUT_OF_MEMORY, "Out of memory");
  store_u32(built.span(), form.key_bits);
  output_cursor out(built.span().subspan(sizeof(uint32_t)));
  for (size_t i = 0; i < form.ids.size(); i++)
    TRY(write_number(key, form.ids[i], lengths[i], &out));
  *record = std::move(built);
  return DONE;
}

bool read_numbers(input_cursor* in, std::span<byte_view> numbers) {
  for (byte_view& number : numbers) {
    if (!in->read_field(&number)) return false;
  }
  return true;
}

TEE_Result number_attributes(std::span<const uint32_t> ids, std::span<const byte_view> numbers,
                             size_t longest, std::span<TEE_Attribute> attributes) {
  for (size_t i = 0; i < ids.size(); i++) {
    const byte_view number = without_leading_zeros(numbers[i]);
    if (number.empty() || number.size() > longest) {
      return fail(TEE_ERROR_BAD_PARAMETERS, "Key number %d has %dB, expect 1 to %dB",
                  static_cast<int>(i), static_cast<int>(number.size()), static_cast<int>(longest));
    }
    attributes[i] = ref_attribute(ids[i], number);
  }
  return TEE_SUCCESS;
}

TEE_Result load_key(uint32_t object_type, uint32_t key_bits,
                    std::span<const TEE_Attribute> attributes, tee_object* key) {
  tee_object loaded;
  TRY(loaded.allocate(object_type, key_bits));
  TRY(loaded.populate(attributes));
  *key = std::move(loaded);
  return TEE_SUCCESS;
}

}  // namespace keymaster
