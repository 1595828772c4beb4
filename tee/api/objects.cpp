// Transient objects: attributes, allocation, population, generation, and what any object tells.
#include "tee_internal_api.h"

#include <vector>

#include "tee/api/arguments.h"
#include "tee/api/operations.h"
#include "tee/core/faults.h"
#include "tee/core/instance.h"
#include "tee/core/object.h"
#include "tee/core/persistent_stream.h"
#include "tee/core/profile.h"
#include "tee/crypto/algorithms.h"

using tee::current_instance;
using tee::current_profile;
using tee::fault_point;
using tee::guarded;
using tee::object;
using tee::panic;
using tee::crypto::attribute;
using tee::crypto::attribute_list;
using tee::crypto::attribute_view;
using tee::crypto::find_key_type;
using tee::crypto::key_type;

namespace {

bool is_value(uint32_t attribute_id) {
  return (attribute_id & TEE_ATTR_FLAG_VALUE) != 0;
}

// An attribute in the trusted application's memory.
attribute_view view_of(const char* call, const TEE_Attribute& given) {
  const auto& content = given.content;
  if (is_value(given.attributeID)) {
    return {given.attributeID, {}, content.value.a, content.value.b};
  }
  return {given.attributeID,
          tee::input_bytes(call, "an attribute's buffer", content.ref.buffer, content.ref.length)};
}

std::span<const TEE_Attribute> checked_list(const char* call, const TEE_Attribute* attributes,
                                            uint32_t count) {
  if (!attributes && count > 0) panic(call, "attributes are null with count %u", count);
  return {attributes, count};
}

// What populates an object of that type; panics when the list breaks a rule.
attribute_list arrange(const char* call, const key_type& type,
                       std::span<const TEE_Attribute> attributes) {
  auto keep = [&](const char* broken_rule) {
    if (broken_rule) panic(call, "%s (type 0x%08x)", broken_rule, type.id);
  };
  attribute_list list(type);
  for (const TEE_Attribute& given : attributes)
    keep(list.add(view_of(call, given)));
  keep(list.complete());
  return list;
}

// The object behind a handle that is to receive a key.
object& empty_object(const char* call, TEE_ObjectHandle handle) {
  object& found = current_instance(call).objects().get(handle, call);
  if (found.persistent()) panic(call, "object is persistent");
  if (found.initialized()) panic(call, "object is initialised already");
  return found;
}

// Which size the trusted application may not go beyond is its own business only where it hands over
// one secret; the numbers of a key pair often come from a client, and a lenient platform looks at
// their values.
void check_sizes(const char* call, const object& target, const attribute_list& attributes) {
  if (!attributes.type().symmetric() && !current_profile().strict) return;
  for (const attribute_view& given : attributes.views()) {
    if (given.bytes.size() > (size_t{target.max_bits} + 7) / 8) {
      panic(call, "an attribute of %zu bytes exceeds the object's %u bits", given.bytes.size(),
            target.max_bits);
    }
  }
}

// The results of the calls that make keys tell of wrong parameters alone, so a strict platform
// panics for lack of memory, and no such fault can be asked of it.
TEE_Result key_fault_point() {
  return current_profile().strict ? TEE_SUCCESS : fault_point();
}

TEE_Result key_result(const char* call, TEE_Result result) {
  if (result == TEE_ERROR_OUT_OF_MEMORY && current_profile().strict) panic(call, "out of memory");
  return result;
}

// The readable attribute behind the arguments of a getter; null when the object does not have it.
const attribute* readable_attribute(const char* call, const object& from, uint32_t id) {
  if (!from.initialized()) panic(call, "object is not initialised");
  if (is_value(id)) panic(call, "attribute 0x%08x is a value, not a buffer", id);
  bool open = (id & TEE_ATTR_FLAG_PUBLIC) != 0 || (from.usage & TEE_USAGE_EXTRACTABLE) != 0;
  if (!open) panic(call, "attribute 0x%08x of a key that is not extractable", id);
  return from.key ? from.key->find(id) : nullptr;
}

}  // namespace

void TEE_InitRefAttribute(TEE_Attribute* attr, uint32_t attributeID, const void* buffer,
                          size_t length) {
  constexpr const char* CALL = "TEE_InitRefAttribute";
  if (!attr) panic(CALL, "attr is null");
  if (is_value(attributeID)) panic(CALL, "attribute 0x%08x is a value", attributeID);
  attr->attributeID = attributeID;
  attr->content.ref.buffer = const_cast<void*>(buffer);  // only read through
  attr->content.ref.length = length;
}

void TEE_InitValueAttribute(TEE_Attribute* attr, uint32_t attributeID, uint32_t a, uint32_t b) {
  constexpr const char* CALL = "TEE_InitValueAttribute";
  if (!attr) panic(CALL, "attr is null");
  if (!is_value(attributeID)) panic(CALL, "attribute 0x%08x is a buffer", attributeID);
  attr->attributeID = attributeID;
  attr->content.value.a = a;
  attr->content.value.b = b;
}

TEE_Result TEE_AllocateTransientObject(uint32_t objectType, uint32_t maxObjectSize,
                                       TEE_ObjectHandle* object) {
  constexpr const char* CALL = "TEE_AllocateTransientObject";
  return guarded(CALL, [&]() -> TEE_Result {
    tee::instance& running = current_instance(CALL);
    if (!object) panic(CALL, "object is null");
    *object = TEE_HANDLE_NULL;
    if (TEE_Result fault = fault_point()) return fault;
    const key_type* type = find_key_type(objectType);
    if (!type || !tee::offers(*type, maxObjectSize)) return TEE_ERROR_NOT_SUPPORTED;
    *object = running.objects().emplace(tee::object{objectType, maxObjectSize});
    return *object ? TEE_SUCCESS : TEE_ERROR_OUT_OF_MEMORY;
  });
}

void TEE_FreeTransientObject(TEE_ObjectHandle object) {
  constexpr const char* CALL = "TEE_FreeTransientObject";
  guarded(CALL, [&] {
    if (!object) return;
    auto& objects = current_instance(CALL).objects();
    if (objects.get(object, CALL).persistent()) panic(CALL, "object is persistent");
    objects.remove(object, CALL);
  });
}

void TEE_CloseObject(TEE_ObjectHandle object) {
  constexpr const char* CALL = "TEE_CloseObject";
  guarded(CALL, [&] {
    if (object) current_instance(CALL).objects().remove(object, CALL);
  });
}

TEE_Result TEE_PopulateTransientObject(TEE_ObjectHandle object, const TEE_Attribute* attrs,
                                       uint32_t attrCount) {
  constexpr const char* CALL = "TEE_PopulateTransientObject";
  const TEE_Result result = guarded(CALL, [&]() -> TEE_Result {
    tee::object& target = empty_object(CALL, object);
    auto attributes =
        arrange(CALL, *find_key_type(target.type), checked_list(CALL, attrs, attrCount));
    check_sizes(CALL, target, attributes);
    if (TEE_Result fault = key_fault_point()) return fault;
    return current_instance(CALL).keys().load(attributes, target.max_bits, &target.key);
  });
  return key_result(CALL, result);
}

TEE_Result TEE_GenerateKey(TEE_ObjectHandle object, uint32_t keySize, const TEE_Attribute* params,
                           uint32_t paramCount) {
  constexpr const char* CALL = "TEE_GenerateKey";
  const TEE_Result result = guarded(CALL, [&]() -> TEE_Result {
    tee::object& target = empty_object(CALL, object);
    const key_type& type = *find_key_type(target.type);
    if (keySize > target.max_bits || !type.allows(keySize)) {
      panic(CALL, "key size %u does not fit type 0x%08x with at most %u bits", keySize, target.type,
            target.max_bits);
    }
    std::vector<attribute_view> parameters;
    for (const TEE_Attribute& given : checked_list(CALL, params, paramCount))
      parameters.push_back(view_of(CALL, given));
    if (TEE_Result fault = key_fault_point()) return fault;
    if (TEE_Result res = tee::crypto::generate_key(target.type, keySize, parameters, &target.key)) {
      return res;
    }
    current_instance(CALL).keys().add(target.key);
    return TEE_SUCCESS;
  });
  return key_result(CALL, result);
}

TEE_Result TEE_GetObjectBufferAttribute(TEE_ObjectHandle object, uint32_t attributeID, void* buffer,
                                        size_t* size) {
  constexpr const char* CALL = "TEE_GetObjectBufferAttribute";
  return guarded(CALL, [&]() -> TEE_Result {
    const tee::object& from = current_instance(CALL).objects().get(object, CALL);
    const attribute* wanted = readable_attribute(CALL, from, attributeID);
    tee::output_buffer output(CALL, "buffer", buffer, size);
    if (TEE_Result fault = fault_point()) return fault;
    return wanted ? output.fill(wanted->bytes) : TEE_ERROR_ITEM_NOT_FOUND;
  });
}

TEE_Result TEE_GetObjectInfo1(TEE_ObjectHandle object, TEE_ObjectInfo* objectInfo) {
  constexpr const char* CALL = "TEE_GetObjectInfo1";
  return guarded(CALL, [&]() -> TEE_Result {
    const tee::object& from = current_instance(CALL).objects().get(object, CALL);
    if (!objectInfo) panic(CALL, "objectInfo is null");
    tee::require_own_output(CALL, "objectInfo", objectInfo, sizeof(*objectInfo));
    if (TEE_Result fault = fault_point()) return fault;
    *objectInfo = {};
    objectInfo->objectType = from.type;
    objectInfo->objectSize = from.key ? from.key->bits() : 0;
    objectInfo->maxObjectSize = from.max_bits;
    objectInfo->objectUsage = from.usage;
    if (from.initialized()) objectInfo->handleFlags |= TEE_HANDLE_FLAG_INITIALIZED;
    if (from.persistent()) {
      objectInfo->handleFlags |= TEE_HANDLE_FLAG_PERSISTENT | from.stream->flags();
      objectInfo->dataSize = from.stream->size();
      objectInfo->dataPosition = from.stream->position();
    }
    return TEE_SUCCESS;
  });
}
