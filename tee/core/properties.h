// Property values and their text forms.
#pragma once

#include "tee_internal_api.h"

#include <map>
#include <string>
#include <variant>

namespace tee {

using property_value = std::variant<std::string, bool, uint32_t, TEE_UUID, TEE_Identity>;
using property_map = std::map<std::string, property_value, std::less<>>;

constexpr uint32_t LITTLE_ENDIAN_CODE = 0;  // of the properties named endian

// property_text: the string form: the text itself, true or false, unsigned decimal, a UUID as
// 8-4-4- 4-12 lower-case hexadecimal, an identity as decimal login, colon, UUID.
std::string property_text(const property_value& value);

}  // namespace tee
