// Properties.
#include <string>

#include "support.h"

namespace tee::test {
namespace {

using platform = in_instance;

TEST_F(platform, properties_as_text) {
  const TEE_Identity client{TEE_LOGIN_TRUSTED_APP, UUID};
  ta_.set_client(&client);
  ta_.properties()["gpd.ta.singleInstance"] = true;
  ta_.properties()["gpd.ta.dataSize"] = uint32_t{4096};
  const std::tuple<TEE_PropSetHandle, const char*, std::string> rows[] = {
      {TEE_PROPSET_TEE_IMPLEMENTATION, "gpd.tee.trustedos.manufacturer", "Keymaster"},
      {TEE_PROPSET_TEE_IMPLEMENTATION, "gpd.tee.firmware.manufacturer", "Keymaster"},
      {TEE_PROPSET_TEE_IMPLEMENTATION, "gpd.tee.TAPersistentTime.protectionLevel", "0"},
      {TEE_PROPSET_TEE_IMPLEMENTATION, "gpd.tee.trustedStorage.rollbackDetection.protectionLevel",
       "100"},
      {TEE_PROPSET_TEE_IMPLEMENTATION, "gpd.tee.cryptography.nist", "true"},
      {TEE_PROPSET_TEE_IMPLEMENTATION, "gpd.tee.event.maxSources", "0"},
      {TEE_PROPSET_CURRENT_TA, "gpd.ta.endian", "0"},
      {TEE_PROPSET_CURRENT_CLIENT, "gpd.client.endian", "0"},
      {TEE_PROPSET_CURRENT_TA, "gpd.ta.appID", "01020304-0506-0708-090a-0b0c0d0e0f10"},
      {TEE_PROPSET_CURRENT_TA, "gpd.ta.singleInstance", "true"},
      {TEE_PROPSET_CURRENT_TA, "gpd.ta.dataSize", "4096"},
      {TEE_PROPSET_CURRENT_CLIENT, "gpd.client.identity",
       "4026531840:01020304-0506-0708-090a-0b0c0d0e0f10"},
  };
  for (const auto& [set, name, expected] : rows) {
    for (size_t capacity = 0; capacity <= expected.size() + 2; ++capacity) {
      std::vector<char> room(capacity, 'x');
      size_t length = capacity;
      TEE_Result result = TEE_GetPropertyAsString(set, name, room.data(), &length);
      bool fits = capacity > expected.size();
      EXPECT_EQ(result, fits ? TEE_SUCCESS : TEE_ERROR_SHORT_BUFFER) << name;
      EXPECT_EQ(length, expected.size() + 1);
      if (capacity > 0) {
        EXPECT_EQ(std::string(room.data()), expected.substr(0, capacity - 1));
      }
    }
    size_t length = 0;
    const std::string other = std::string(name) + ".x";
    EXPECT_EQ(TEE_GetPropertyAsString(set, other.c_str(), nullptr, &length),
              TEE_ERROR_ITEM_NOT_FOUND);
  }
}

}  // namespace
}  // namespace tee::test
