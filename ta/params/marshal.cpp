// The byte form of parameter sets.
#include "ta/params/marshal.h"

namespace keymaster {
namespace {

constexpr size_t ENTRY_SIZE = sizeof(keymaster_key_param_t);

bool is_hidden(keymaster_tag_t tag) {
  return tag == KM_TAG_APPLICATION_ID || tag == KM_TAG_APPLICATION_DATA ||
         tag == KM_TAG_ROOT_OF_TRUST;
}

// Reads one entry with its blob. The record that comes in may carry anything where the data pointer
// stands; it is replaced before anyone can see it.
TEE_Result read_entry(input_cursor* in, keymaster_key_param_t* entry) {
  keymaster_key_param_t record{};
  if (!in->read_into(object_bytes(record))) return fail(TEE_ERROR_GENERIC, "Too short input");
  if (has_blob(record.tag)) {
    byte_view bytes;
    heap_buffer data;
    if (!in->read_bytes(record.data_length, &bytes))
      return fail(TEE_ERROR_GENERIC, "Too short input");
    if (!data.copy_of(bytes)) {
      return fail(TEE_ERROR_OUT_OF_MEMORY, "Out of memory, require %dB",
                  static_cast<int>(record.data_length));
    }
    record.long_integer = 0;
    record.data = data.release();
  }
  *entry = record;
  return TEE_SUCCESS;
}

// Writes one entry with its blob. An address of this TA must not leave it: the value field of a
// blob entry, which no reader interprets, goes out as zeros.
TEE_Result write_entry(output_cursor* out, const keymaster_key_param_t& param) {
  keymaster_key_param_t record = param;
  const bool blob = has_blob(param.tag);
  if (blob) record.long_integer = 0;
  if (!out->write_bytes(object_bytes(std::as_const(record))))
    return fail(TEE_ERROR_GENERIC, "Too short buffer");
  if (!blob) return TEE_SUCCESS;
  if (param.data == nullptr)
    return fail(TEE_ERROR_BAD_PARAMETERS, "Invalid keymaster_key_param_set_t");
  if (!out->write_bytes(param.blob())) return fail(TEE_ERROR_GENERIC, "Too short buffer");
  return TEE_SUCCESS;
}

TEE_Result write_set(const keymaster_key_param_set_t& set, bool include_all, byte_span buffer) {
  uint32_t count = 0;
  for (const keymaster_key_param_t& param : set) {
    if (include_all || !is_hidden(param.tag)) count++;
  }
  output_cursor out(buffer);
  if (!out.write_u32(count)) return fail(TEE_ERROR_GENERIC, "Too short buffer");
  for (const keymaster_key_param_t& param : set) {
    if (!include_all && is_hidden(param.tag)) continue;
    TRY(write_entry(&out, param));
  }
  return TEE_SUCCESS;
}

}  // namespace

TEE_Result unmarshal(byte_view input, keymaster_key_param_set_t* set) {
  const trace_scope scope;
  if (set == nullptr) return TEE_ERROR_SHORT_BUFFER;
  set->params = nullptr;
  set->length = 0;
  input_cursor in(input);
  uint32_t count = 0;
  if (!in.read_u32(&count)) return fail(TEE_ERROR_GENERIC, "Too short input");
  if (count == 0) return TEE_SUCCESS;  // most commands carry no parameters
  if (count > UINT32_MAX / ENTRY_SIZE) return fail(TEE_ERROR_OUT_OF_MEMORY, "Out of memory");
  // Never room for more records than the input can hold: a count is four bytes, an array is not.
  const size_t capacity = count < in.left() / ENTRY_SIZE ? count : in.left() / ENTRY_SIZE;

  heap_buffer array;
  if (!array.allocate(capacity * ENTRY_SIZE)) {
    return fail(TEE_ERROR_OUT_OF_MEMORY, "Out of memory");
  }
  auto* records = reinterpret_cast<keymaster_key_param_t*>(array.data());
  for (uint32_t i = 0; i < count; i++) {
    keymaster_key_param_t entry{};
    if (TEE_Result res = read_entry(&in, &entry)) {
      free_param_entries(records, i);
      return res;
    }
    records[i] = entry;
  }
  set->params = records;
  set->length = count;
  static_cast<void>(array.release());
  return TEE_SUCCESS;
}

uint32_t marshal_size(const keymaster_key_param_set_t& set, bool include_all) {
  uint64_t size = sizeof(uint32_t);
  for (const keymaster_key_param_t& param : set) {
    if (!include_all && is_hidden(param.tag)) continue;
    size += ENTRY_SIZE + (has_blob(param.tag) ? param.data_length : 0);
  }
  // A set lives in the TA's heap, which is far smaller than 4 GiB.
  return size > UINT32_MAX ? UINT32_MAX : static_cast<uint32_t>(size);
}

TEE_Result marshal(const keymaster_key_param_set_t& set, bool include_all, uint8_t** buffer,
                   uint32_t* size) {
  const trace_scope scope;
  uint8_t* given = std::exchange(*buffer, nullptr);
  const uint32_t capacity = std::exchange(*size, 0);
  const uint32_t need = marshal_size(set, include_all);
  heap_buffer own;
  if (given == nullptr) {
    if (!own.allocate(need)) {
      return fail(TEE_ERROR_OUT_OF_MEMORY, "Out of memory, need %dB", static_cast<int>(need));
    }
  } else if (capacity < need) {
    return fail(TEE_ERROR_SHORT_BUFFER, "Too short marshalling buffer");
  }
  const byte_span to = given == nullptr ? own.span() : byte_span{given, need};
  TRY(write_set(set, include_all, to));
  *buffer = given == nullptr ? own.release() : given;
  *size = need;
  return TEE_SUCCESS;
}

}  // namespace keymaster
