// Property values and their text forms.
#include "tee/core/properties.h"

#include "tee/device/uuid.h"

namespace tee {

std::string property_text(const property_value& value) {
  struct to_string {
    std::string operator()(const std::string& text) const { return text; }
    std::string operator()(bool flag) const { return flag ? "true" : "false"; }
    std::string operator()(uint32_t number) const { return std::to_string(number); }
    std::string operator()(const TEE_UUID& uuid) const { return to_text(uuid); }
    std::string operator()(const TEE_Identity& identity) const {
      return std::to_string(identity.login) + ":" + to_text(identity.uuid);
    }
  };
  return std::visit(to_string{}, value);
}

}  // namespace tee
