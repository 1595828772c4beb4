// API calls without a trusted application.
#include "support.h"

#include "temp_device.h"

namespace tee::test {
namespace {

struct open_device {
  temp_device folder;
  std::unique_ptr<device> open = folder.open();
};

}  // namespace

device& shared_device() {
  static open_device shared;
  return *shared.open;
}

TEE_Attribute ref(uint32_t id, const bytes& value) {
  TEE_Attribute attribute;
  TEE_InitRefAttribute(&attribute, id, value.data(), value.size());
  return attribute;
}

TEE_ObjectHandle secret_key(uint32_t type, const bytes& secret) {
  TEE_ObjectHandle key = nullptr;
  auto bits = static_cast<uint32_t>(secret.size() * 8);
  EXPECT_EQ(TEE_AllocateTransientObject(type, bits, &key), TEE_SUCCESS);
  const TEE_Attribute attribute = ref(TEE_ATTR_SECRET_VALUE, secret);
  EXPECT_EQ(TEE_PopulateTransientObject(key, &attribute, 1), TEE_SUCCESS);
  return key;
}

TEE_OperationHandle operation(uint32_t algorithm, uint32_t mode, uint32_t bits,
                              TEE_ObjectHandle key) {
  TEE_OperationHandle made = nullptr;
  EXPECT_EQ(TEE_AllocateOperation(&made, algorithm, mode, bits), TEE_SUCCESS);
  if (!key) return made;
  EXPECT_EQ(TEE_SetOperationKey(made, key), TEE_SUCCESS);
  TEE_FreeTransientObject(key);
  return made;
}

}  // namespace tee::test
