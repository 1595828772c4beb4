// TEE Internal Core API: properties of the implementation, of the running trusted application and
// of its client.
#include "tee/core/properties.h"

#include "tee_internal_api.h"

#include <algorithm>
#include <cstring>
#include <optional>
#include <string_view>
#include <variant>

#include "tee/api/arguments.h"
#include "tee/core/faults.h"
#include "tee/core/instance.h"
#include "tee/device/uuid.h"

namespace tee {
namespace {

constexpr uint32_t CORE_API_VERSION = 0x01030000;  // major, minor, maintenance, 0
// How hard it is to tamper with: 100, as hard as for the normal world's own software.
constexpr uint32_t PROTECTED_BY_REE = 100;
// The largest number of TEE_BigInt..., in bits: half the modulus of the largest RSA key would do.
constexpr uint32_t MAX_BIG_INT_BITS = 8192;

// What is the same on every device. Versions in binary are empty: there is none but the text.
struct fixed_property {
  std::string_view name;
  std::variant<const char*, bool, uint32_t> value;
};
constexpr fixed_property FIXED[] = {
    {"gpd.tee.apiversion", "1.3"},
    {"gpd.tee.internalCore.version", CORE_API_VERSION},
    {"gpd.tee.arith.maxBigIntSize", MAX_BIG_INT_BITS},
    {"gpd.tee.description", "TEE on a general-purpose host"},
    {"gpd.tee.systemTime.protectionLevel", PROTECTED_BY_REE},
    {"gpd.tee.trustedStorage.antiRollback.protectionLevel", PROTECTED_BY_REE},
    {"gpd.tee.trustedStorage.rollbackDetection.protectionLevel", PROTECTED_BY_REE},
    {"gpd.tee.TAPersistentTime.protectionLevel", uint32_t{0}},
    {"gpd.tee.cryptography.ecc", true},
    {"gpd.tee.cryptography.nist", true},
    {"gpd.tee.cryptography.bsi-r", false},
    {"gpd.tee.cryptography.bsi-t", false},
    {"gpd.tee.cryptography.ietf", false},
    {"gpd.tee.cryptography.octa", false},
    {"gpd.tee.trustedos.implementation.binaryversion", ""},
    {"gpd.tee.firmware.implementation.binaryversion", ""},
    {"gpd.tee.event.maxSources", uint32_t{0}},
};

using lookup = property_value (*)(device&);
struct device_property {
  std::string_view name;
  lookup value;
};
constexpr lookup MANUFACTURER = [](device& dev) {
  return property_value(dev.settings().manufacturer);
};
constexpr lookup VERSION = [](device& dev) {
  return property_value(dev.settings().implementation_version);
};
// The operating system is its own firmware.
constexpr device_property OF_DEVICE[] = {
    {"gpd.tee.deviceID", [](device& dev) { return property_value(dev.identity()); }},
    {"keymaster.device.publicID",
     [](device& dev) { return property_value(dev.settings().public_id); }},
    {"gpd.tee.trustedos.manufacturer", MANUFACTURER},
    {"gpd.tee.firmware.manufacturer", MANUFACTURER},
    {"gpd.tee.trustedos.implementation.version", VERSION},
    {"gpd.tee.firmware.implementation.version", VERSION},
};

template <typename Table>
auto find_in(const Table& table, std::string_view name) {
  auto found = std::find_if(std::begin(table), std::end(table),
                            [=](const auto& property) { return property.name == name; });
  return found == std::end(table) ? nullptr : &*found;
}

std::optional<property_value> of_implementation(device& dev, std::string_view name) {
  if (const auto* property = find_in(OF_DEVICE, name)) return property->value(dev);
  if (const auto* property = find_in(FIXED, name)) {
    return std::visit([](auto value) { return property_value(value); }, property->value);
  }
  return std::nullopt;
}

std::optional<property_value> of_client(const TEE_Identity* client, std::string_view name) {
  if (client && name == "gpd.client.identity") return *client;
  if (client && name == "gpd.client.endian") return LITTLE_ENDIAN_CODE;
  return std::nullopt;
}

std::optional<property_value> find_property(const char* call, TEE_PropSetHandle set,
                                            const char* name) {
  instance& caller = current_instance(call);
  if (!name) panic(call, "name is null");
  if (set == TEE_PROPSET_TEE_IMPLEMENTATION) {
    return of_implementation(caller.dev(), name);
  }
  if (set == TEE_PROPSET_CURRENT_CLIENT) {
    return of_client(caller.client(), name);
  }
  if (set == TEE_PROPSET_CURRENT_TA) {
    auto found = caller.properties().find(std::string_view(name));
    return found == caller.properties().end() ? std::nullopt : std::optional(found->second);
  }
  panic(call, "%p is not a property set", static_cast<void*>(set));
}

// As much of the text as fits is there even when the room is short.
TEE_Result put_text(const std::string& text, output_buffer value) {
  size_t needed = text.size() + 1;
  if (size_t room = std::min(needed, value.capacity()); room > 0) {
    std::memcpy(value.data(), text.data(), room - 1);
    value.data()[room - 1] = 0;
  }
  if (TEE_Result res = value.reserve(needed)) return res;
  value.set_length(needed);
  return TEE_SUCCESS;
}

// The common course of the calls: look the property up, and let `convert` make of it what was
// asked.
template <typename Convert>
TEE_Result get_property(const char* call, TEE_PropSetHandle set, const char* name,
                        const void* value, Convert&& convert) {
  return guarded(call, [&]() -> TEE_Result {
    if (!value) panic(call, "value is null");
    std::optional<property_value> property = find_property(call, set, name);
    if (TEE_Result fault = fault_point()) return fault;
    if (!property) return TEE_ERROR_ITEM_NOT_FOUND;
    return convert(*property);
  });
}

}  // namespace

}  // namespace tee

using tee::property_value;

TEE_Result TEE_GetPropertyAsString(TEE_PropSetHandle propsetOrEnumerator, const char* name,
                                   char* valueBuffer, size_t* valueBufferLen) {
  constexpr const char* CALL = "TEE_GetPropertyAsString";
  return tee::get_property(
      CALL, propsetOrEnumerator, name, valueBufferLen, [&](const property_value& value) {
        tee::output_buffer text(CALL, "valueBuffer", valueBuffer, valueBufferLen);
        return tee::put_text(tee::property_text(value), text);
      });
}

TEE_Result TEE_GetPropertyAsU32(TEE_PropSetHandle propsetOrEnumerator, const char* name,
                                uint32_t* value) {
  return tee::get_property("TEE_GetPropertyAsU32", propsetOrEnumerator, name, value,
                           [&](const property_value& property) -> TEE_Result {
                             auto* number = std::get_if<uint32_t>(&property);
                             if (!number) return TEE_ERROR_BAD_FORMAT;
                             *value = *number;
                             return TEE_SUCCESS;
                           });
}

TEE_Result TEE_GetPropertyAsUUID(TEE_PropSetHandle propsetOrEnumerator, const char* name,
                                 TEE_UUID* value) {
  return tee::get_property("TEE_GetPropertyAsUUID", propsetOrEnumerator, name, value,
                           [&](const property_value& property) -> TEE_Result {
                             if (auto* uuid = std::get_if<TEE_UUID>(&property)) {
                               *value = *uuid;
                               return TEE_SUCCESS;
                             }
                             auto* text = std::get_if<std::string>(&property);
                             return text && tee::parse_uuid(*text, value) ? TEE_SUCCESS
                                                                          : TEE_ERROR_BAD_FORMAT;
                           });
}

TEE_Result TEE_GetPropertyAsIdentity(TEE_PropSetHandle propsetOrEnumerator, const char* name,
                                     TEE_Identity* value) {
  return tee::get_property("TEE_GetPropertyAsIdentity", propsetOrEnumerator, name, value,
                           [&](const property_value& property) -> TEE_Result {
                             auto* identity = std::get_if<TEE_Identity>(&property);
                             if (!identity) return TEE_ERROR_BAD_FORMAT;
                             *value = *identity;
                             return TEE_SUCCESS;
                           });
}
