// Vault: keeps what the factory gave the device for SOTER: the key pair, data and properties. It
// stands where a device has its provisioning application.
//
// Command 100, provision, once in the life of a device. Slot 0, memory input: the record, five
// fields, each a u32 little-endian length and its bytes: key box (a TLV box, at most 8192 bytes),
// TA data (1024), property box (a TLV box, 512), CPU id (64), device id (128). An empty field is
// not provisioned. TEE_ERROR_BAD_PARAMETERS for a record that is not in this form,
// TEE_ERROR_ACCESS_CONFLICT when the device was provisioned before. The record is stored whole or
// not at all; what its boxes hold is for those who read them.
//
// The others serve the Keymaster TA alone (TEE_ERROR_ACCESS_DENIED):
// Command 2, retrieve the key box; command 5, retrieve the TA data. Slot 0, memory output; slot 1,
// value output: a, the number of bytes written.
// Command 12, retrieve a property. Slot 0, memory input: two u16 little-endian words; slot 1,
// memory output. 0x1834 0: the property box; 0x1734 0x173A: the CPU id; 0x1934 0x1936: the device
// id.
//
// TEE_ERROR_ITEM_NOT_FOUND: not provisioned, or no such property. TEE_ERROR_SHORT_BUFFER: the
// output is too small; its size is then what it takes. TEE_ERROR_BAD_PARAMETERS: other slots, or a
// request of another length. TEE_ERROR_NOT_SUPPORTED: other commands.
#include "tee_internal_api.h"

#include <cstddef>
#include <cstdint>
#include <cstring>

#include "tee/peers/support.h"

namespace {

using peers::block;

constexpr uint32_t COMMAND_RETRIEVE_KEY = 2;
constexpr uint32_t COMMAND_RETRIEVE_TA_DATA = 5;
constexpr uint32_t COMMAND_RETRIEVE_PROPERTY = 12;
constexpr uint32_t COMMAND_PROVISION = 100;

constexpr char RECORD_NAME[] = "Vault record";

enum item : size_t { KEY_BOX, TA_DATA, PROPERTY_BOX, CPU_ID, DEVICE_ID, ITEM_COUNT };
constexpr size_t ITEM_LIMITS[ITEM_COUNT] = {8192, 1024, 512, 64, 128};
constexpr size_t LENGTH_SIZE = 4;
constexpr size_t MAX_RECORD = ITEM_COUNT * LENGTH_SIZE + 8192 + 1024 + 512 + 64 + 128;

// A property request as one number: the first word in the low half.
struct property {
  uint32_t request;
  item source;
};
constexpr size_t REQUEST_SIZE = 4;
constexpr property PROPERTIES[] = {
    {0x00001834, PROPERTY_BOX}, {0x173A1734, CPU_ID}, {0x19361934, DEVICE_ID}};

struct field {
  const uint8_t* data;
  size_t length;
};

// Takes a record apart; false unless it is five fields within their limits and nothing else.
bool parse_record(const uint8_t* record, size_t size, field* fields) {
  for (size_t i = 0; i < ITEM_COUNT; i++) {
    if (size < LENGTH_SIZE) return false;
    fields[i] = {record + LENGTH_SIZE, peers::load_u32(record)};
    size -= LENGTH_SIZE;
    if (fields[i].length > size || fields[i].length > ITEM_LIMITS[i]) return false;
    record = fields[i].data + fields[i].length;
    size -= fields[i].length;
  }
  return size == 0;
}

TEE_Result provision(uint32_t types, const TEE_Param* params) {
  if (types != TEE_PARAM_TYPES(TEE_PARAM_TYPE_MEMREF_INPUT, 0, 0, 0) ||
      params[0].memref.size > MAX_RECORD) {
    return TEE_ERROR_BAD_PARAMETERS;
  }
  block record;
  if (TEE_Result res = record.copy_of(params[0].memref.buffer, params[0].memref.size)) return res;
  field fields[ITEM_COUNT];
  if (!parse_record(record.data(), record.size(), fields)) return TEE_ERROR_BAD_PARAMETERS;
  TEE_ObjectHandle object = TEE_HANDLE_NULL;
  TEE_Result res = TEE_CreatePersistentObject(TEE_STORAGE_PRIVATE, RECORD_NAME, sizeof(RECORD_NAME),
                                              TEE_DATA_FLAG_ACCESS_READ, TEE_HANDLE_NULL,
                                              record.data(), record.size(), &object);
  if (res == TEE_SUCCESS) TEE_CloseObject(object);
  return res;
}

TEE_Result read_record(block* record) {
  TEE_ObjectHandle object = TEE_HANDLE_NULL;
  TEE_Result res = TEE_OpenPersistentObject(TEE_STORAGE_PRIVATE, RECORD_NAME, sizeof(RECORD_NAME),
                                            TEE_DATA_FLAG_ACCESS_READ, &object);
  if (res != TEE_SUCCESS) return res;
  res = record->read_object(object);
  TEE_CloseObject(object);
  return res;
}

// An identifier of the platform in its text form, with its terminating zero byte.
struct id_text {
  char text[37] = {};

  TEE_Result read(const char* property) {
    size_t size = sizeof(text);
    return TEE_GetPropertyAsString(TEE_PROPSET_TEE_IMPLEMENTATION, property, text, &size);
  }
};

// Calls visit(byte, digit) for the bytes of `name` but hyphens, each with the digit of `id` at its
// place; false unless there are as many and every visit says yes.
template <typename F>
bool visit_digits(field name, const id_text& id, F visit) {
  const char* digit = id.text;
  for (size_t i = 0; i < name.length; i++) {
    if (name.data[i] == '-') continue;
    while (*digit == '-')
      digit++;
    if (*digit == 0 || !visit(i, *digit++)) return false;
  }
  return *digit == 0;
}

// Early records name the device by its identity. That is key material, so the public identifier
// goes out in its place, digit for digit. `record` is what `name` lies in.
TEE_Result hide_identity(field name, uint8_t* record) {
  id_text identity;
  if (TEE_Result res = identity.read("gpd.tee.deviceID")) return res;
  const bool is_identity = visit_digits(
      name, identity, [&](size_t i, char digit) { return (name.data[i] | 0x20) == digit; });
  if (!is_identity) return TEE_SUCCESS;
  id_text shown;
  if (TEE_Result res = shown.read("keymaster.device.publicID")) return res;
  uint8_t* bytes = record + (name.data - record);
  visit_digits(name, shown, [&](size_t i, char digit) {
    bytes[i] = static_cast<uint8_t>(digit);
    return true;
  });
  return TEE_SUCCESS;
}

// Writes one item of the record to `output`, whose size becomes the item's length.
TEE_Result retrieve(item which, TEE_Param* output) {
  block record;
  if (TEE_Result res = read_record(&record)) return res;
  field fields[ITEM_COUNT];
  if (!parse_record(record.data(), record.size(), fields)) return TEE_ERROR_BAD_STATE;
  const field& found = fields[which];
  if (found.length == 0) return TEE_ERROR_ITEM_NOT_FOUND;
  if (which == CPU_ID || which == DEVICE_ID) {
    if (TEE_Result res = hide_identity(found, record.data())) return res;
  }
  const size_t capacity = output->memref.size;
  output->memref.size = found.length;
  if (capacity < found.length) return TEE_ERROR_SHORT_BUFFER;
  memcpy(output->memref.buffer, found.data, found.length);
  return TEE_SUCCESS;
}

TEE_Result handle_retrieve(item which, uint32_t types, TEE_Param* params) {
  if (types != TEE_PARAM_TYPES(TEE_PARAM_TYPE_MEMREF_OUTPUT, TEE_PARAM_TYPE_VALUE_OUTPUT, 0, 0)) {
    return TEE_ERROR_BAD_PARAMETERS;
  }
  if (TEE_Result res = peers::require_keymaster()) return res;
  TEE_Result res = retrieve(which, &params[0]);
  params[1].value.a = res == TEE_SUCCESS ? static_cast<uint32_t>(params[0].memref.size) : 0;
  return res;
}

TEE_Result handle_retrieve_property(uint32_t types, TEE_Param* params) {
  if (types != TEE_PARAM_TYPES(TEE_PARAM_TYPE_MEMREF_INPUT, TEE_PARAM_TYPE_MEMREF_OUTPUT, 0, 0) ||
      params[0].memref.size != REQUEST_SIZE) {
    return TEE_ERROR_BAD_PARAMETERS;
  }
  if (TEE_Result res = peers::require_keymaster()) return res;
  const uint32_t request = peers::load_u32(static_cast<const uint8_t*>(params[0].memref.buffer));
  for (const property& row : PROPERTIES) {
    if (row.request == request) return retrieve(row.source, &params[1]);
  }
  return TEE_ERROR_ITEM_NOT_FOUND;
}

}  // namespace

TEE_Result TA_InvokeCommandEntryPoint(void* /*sessionContext*/, uint32_t commandID,
                                      uint32_t paramTypes, TEE_Param* params) {
  switch (commandID) {
    case COMMAND_RETRIEVE_KEY:
      return handle_retrieve(KEY_BOX, paramTypes, params);
    case COMMAND_RETRIEVE_TA_DATA:
      return handle_retrieve(TA_DATA, paramTypes, params);
    case COMMAND_RETRIEVE_PROPERTY:
      return handle_retrieve_property(paramTypes, params);
    case COMMAND_PROVISION:
      return provision(paramTypes, params);
    default:
      return TEE_ERROR_NOT_SUPPORTED;
  }
}
