// TEE Internal Core API: persistent objects.
#include "tee_internal_api.h"

#include <new>
#include <utility>

#include "tee/api/arguments.h"
#include "tee/core/faults.h"
#include "tee/core/instance.h"
#include "tee/core/object.h"
#include "tee/core/panic.h"
#include "tee/core/persistent_stream.h"

using tee::ACCESS_FLAGS;
using tee::fault_point;
using tee::guarded;
using tee::object;
using tee::panic;
using tee::persistent_stream;
using tee::SHARE_FLAGS;
using tee::stored_object;

namespace {

// What a call asks for by storage, identifier and flags, with the rules on them checked.
tee::object_name checked_name(const char* call, uint32_t storage, const void* id, size_t id_length,
                              uint32_t flags, uint32_t allowed_flags) {
  if (id_length > TEE_OBJECT_ID_MAX_LEN) {
    panic(call, "objectIDLen %zu is above %d", id_length, TEE_OBJECT_ID_MAX_LEN);
  }
  if ((flags & ~allowed_flags) != 0) panic(call, "flags 0x%x hold unknown bits", flags);
  auto bytes = tee::input_bytes(call, "objectID", id, id_length);
  tee::require_own(call, "objectID", id, id_length);
  tee::uuid_bytes owner = tee::to_bytes(tee::current_instance(call).uuid());
  return {storage, owner, {bytes.begin(), bytes.end()}};
}

// The stream behind a handle that must be persistent and have the right.
persistent_stream& stream_of(const char* call, TEE_ObjectHandle handle, uint32_t right) {
  object& found = tee::current_instance(call).objects().get(handle, call);
  if (!found.persistent()) panic(call, "object is not persistent");
  if ((found.stream->flags() & right) != right)
    panic(call, "object lacks access right 0x%x", right);
  return *found.stream;
}

// Gives the object of a fresh stream its type and key.
TEE_Result take_attributes(const char* call, const stored_object& stored, object* target) {
  target->type = stored.type;
  target->max_bits = stored.max_bits;
  target->usage = stored.usage;
  if (stored.attributes.empty()) return TEE_SUCCESS;
  const auto* type = tee::crypto::find_key_type(stored.type);
  if (type == nullptr) return TEE_ERROR_CORRUPT_OBJECT;
  tee::crypto::attribute_list list(*type);
  for (const auto& held : stored.attributes) {
    if (list.add({held.id, held.bytes, held.a, held.b})) return TEE_ERROR_CORRUPT_OBJECT;
  }
  if (list.complete()) return TEE_ERROR_CORRUPT_OBJECT;
  TEE_Result res = tee::current_instance(call).keys().load(list, stored.max_bits, &target->key);
  return res == TEE_ERROR_BAD_PARAMETERS ? TEE_ERROR_CORRUPT_OBJECT : res;
}

stored_object content_of(const char* call, TEE_ObjectHandle attributes, const void* data,
                         size_t length) {
  stored_object content;
  content.usage = TEE_USAGE_DEFAULT;
  if (attributes != TEE_HANDLE_NULL) {
    const object& source = tee::current_instance(call).objects().get(attributes, call);
    if (!source.initialized()) panic(call, "attributes is an uninitialised object");
    content.type = source.type;
    content.max_bits = source.max_bits;
    content.usage = source.usage;
    if (source.key) content.attributes = source.key->attributes();
  }
  const auto* bytes = static_cast<const uint8_t*>(data);
  if (bytes == nullptr) content.data.resize(length);
  if (bytes != nullptr) content.data.assign(bytes, bytes + length);
  return content;
}

// Makes the handle first, so that nothing can fail once the object is open or stored:
// open(std::shared_ptr<persistent_stream>*) does that.
template <typename Open>
TEE_Result open_with_handle(const char* call, TEE_ObjectHandle* handle, Open open) {
  auto& objects = tee::current_instance(call).objects();
  TEE_ObjectHandle made = objects.emplace();
  if (made == TEE_HANDLE_NULL) return TEE_ERROR_OUT_OF_MEMORY;
  object& opened = objects.get(made, call);
  TEE_Result res = TEE_ERROR_OUT_OF_MEMORY;
  try {
    res = open(&opened.stream);
    if (res == TEE_SUCCESS) res = take_attributes(call, opened.stream->attributes(), &opened);
  } catch (const std::bad_alloc&) {  // and the result says so
  }
  if (res != TEE_SUCCESS) {
    objects.remove(made, call);
    return res;
  }
  *handle = made;
  return TEE_SUCCESS;
}

}  // namespace

TEE_Result TEE_OpenPersistentObject(uint32_t storageID, const void* objectID, size_t objectIDLen,
                                    uint32_t flags, TEE_ObjectHandle* object) {
  constexpr const char* CALL = "TEE_OpenPersistentObject";
  return guarded(CALL, [&]() -> TEE_Result {
    auto name =
        checked_name(CALL, storageID, objectID, objectIDLen, flags, ACCESS_FLAGS | SHARE_FLAGS);
    if (object == nullptr) panic(CALL, "object is null");
    *object = TEE_HANDLE_NULL;
    if (TEE_Result res = fault_point()) return res;
    return open_with_handle(CALL, object, [&](auto* stream) {
      return persistent_stream::open(tee::current_instance(CALL).dev(), name, flags, stream);
    });
  });
}

TEE_Result TEE_CreatePersistentObject(uint32_t storageID, const void* objectID, size_t objectIDLen,
                                      uint32_t flags, TEE_ObjectHandle attributes,
                                      const void* initialData, size_t initialDataLen,
                                      TEE_ObjectHandle* object) {
  constexpr const char* CALL = "TEE_CreatePersistentObject";
  return guarded(CALL, [&]() -> TEE_Result {
    auto name = checked_name(CALL, storageID, objectID, objectIDLen, flags,
                             ACCESS_FLAGS | SHARE_FLAGS | TEE_DATA_FLAG_OVERWRITE);
    if (object != nullptr) *object = TEE_HANDLE_NULL;
    if (TEE_Result res = fault_point()) return res;
    if (initialDataLen > tee::STREAM_LIMIT) return TEE_ERROR_STORAGE_NO_SPACE;
    auto content = content_of(CALL, attributes, initialData, initialDataLen);
    const auto create = [&](std::shared_ptr<persistent_stream>* stream) {
      return persistent_stream::create(tee::current_instance(CALL).dev(), name, flags,
                                       std::move(content), stream);
    };
    if (object != nullptr) return open_with_handle(CALL, object, create);
    std::shared_ptr<persistent_stream> stored;  // and closed again
    return create(&stored);
  });
}

TEE_Result TEE_CloseAndDeletePersistentObject1(TEE_ObjectHandle object) {
  constexpr const char* CALL = "TEE_CloseAndDeletePersistentObject1";
  return guarded(CALL, [&]() -> TEE_Result {
    if (object == TEE_HANDLE_NULL) return TEE_SUCCESS;
    stream_of(CALL, object, TEE_DATA_FLAG_ACCESS_WRITE_META);
    auto& objects = tee::current_instance(CALL).objects();
    const auto stream = objects.get(object, CALL).stream;  // the handle ends first
    objects.remove(object, CALL);
    if (TEE_Result res = fault_point()) return res;
    return stream->remove() == TEE_SUCCESS ? TEE_SUCCESS : TEE_ERROR_STORAGE_NOT_AVAILABLE;
  });
}

TEE_Result TEE_ReadObjectData(TEE_ObjectHandle object, void* buffer, size_t size, size_t* count) {
  constexpr const char* CALL = "TEE_ReadObjectData";
  return guarded(CALL, [&]() -> TEE_Result {
    persistent_stream& stream = stream_of(CALL, object, TEE_DATA_FLAG_ACCESS_READ);
    if (count == nullptr) panic(CALL, "count is null");
    if (buffer == nullptr && size != 0) panic(CALL, "buffer is null");
    tee::require_own_output(CALL, "buffer", buffer, size);
    *count = 0;
    if (TEE_Result res = fault_point()) return res;
    *count = stream.read({static_cast<uint8_t*>(buffer), size});
    return TEE_SUCCESS;
  });
}

TEE_Result TEE_WriteObjectData(TEE_ObjectHandle object, const void* buffer, size_t size) {
  constexpr const char* CALL = "TEE_WriteObjectData";
  return guarded(CALL, [&]() -> TEE_Result {
    persistent_stream& stream = stream_of(CALL, object, TEE_DATA_FLAG_ACCESS_WRITE);
    auto bytes = tee::input_bytes(CALL, "buffer", buffer, size);
    if (TEE_Result res = fault_point()) return res;
    return stream.write(bytes);
  });
}

TEE_Result TEE_SeekObjectData(TEE_ObjectHandle object, intmax_t offset, TEE_Whence whence) {
  constexpr const char* CALL = "TEE_SeekObjectData";
  return guarded(CALL, [&]() -> TEE_Result {
    persistent_stream& stream = stream_of(CALL, object, 0);
    if (whence != TEE_DATA_SEEK_SET && whence != TEE_DATA_SEEK_CUR && whence != TEE_DATA_SEEK_END) {
      panic(CALL, "whence %d is unknown", static_cast<int>(whence));
    }
    if (TEE_Result res = fault_point()) return res;
    return stream.seek(offset, whence);
  });
}
