// The stand-ins for sibling trusted applications, as the normal world meets them.
#include "support/ta_under_test.h"

namespace keymaster::test {
namespace {

constexpr TEEC_UUID VAULT = VAULT_TA_UUID;

constexpr uint32_t PROVISION = 100;
constexpr uint32_t IN = TEEC_MEMREF_TEMP_INPUT;
constexpr uint32_t OUT = TEEC_MEMREF_TEMP_OUTPUT;

class Siblings : public testing::Test {
 protected:
  // A call with the same memory in every slot that takes some.
  TEEC_Result call(const TEEC_UUID& application, uint32_t command, uint32_t types,
                   bytes memory = {}) {
    client::connection sibling(client::context(ta.path()), application);
    client::parameter_slots slots{};
    for (int i = 0; i < 4; i++) {
      if ((types >> 4 * i & 0xF) >= IN) slots[i].tmpref = {memory.data(), memory.size()};
    }
    return sibling.invoke(command, types, &slots).tee;
  }
  TEEC_Result provision(const bytes& record) { return call(VAULT, PROVISION, IN, record); }

  static bytes record(std::vector<size_t> sizes) {
    client::field_writer writer;
    for (const size_t size : sizes)
      writer.field(bytes(size, 0x11));
    return writer.take();
  }

  ta_under_test ta;
};

TEST_F(Siblings, SecretsAreKeptFromTheNormalWorld) {
  EXPECT_EQ(provision(record({8192, 1024, 512, 64, 128})), TEEC_SUCCESS);
  // A command with the types and the room that it takes from other trusted applications.
  const std::tuple<TEEC_UUID, uint32_t, uint32_t, size_t> rows[] = {
      {VAULT, 2, TEEC_PARAM_TYPES(OUT, TEEC_VALUE_OUTPUT, 0, 0), 8192},
      {VAULT, 5, TEEC_PARAM_TYPES(OUT, TEEC_VALUE_OUTPUT, 0, 0), 8192},
      {VAULT, 12, TEEC_PARAM_TYPES(IN, OUT, 0, 0), 4},
      {EARLIER_KEYMASTER_TA_UUID, 27, TEEC_MEMREF_TEMP_INOUT, 64},
  };
  for (const auto& [application, command, types, size] : rows) {
    SCOPED_TRACE(command);
    EXPECT_EQ(call(application, command, types, bytes(size)), TEEC_ERROR_ACCESS_DENIED);
    EXPECT_EQ(call(application, command, TEEC_VALUE_INPUT), TEEC_ERROR_BAD_PARAMETERS);
  }
}

TEST_F(Siblings, ADeviceIsProvisionedOnceAndWhole) {
  const bytes bad[] = {{},
                       record({1, 1, 1, 1}),
                       record({1, 1, 1, 1, 1, 1}),
                       record({8193, 0, 0, 0, 0}),
                       record({0, 1025, 0, 0, 0}),
                       record({0, 0, 513, 0, 0}),
                       record({0, 0, 0, 65, 0}),
                       record({0, 0, 0, 0, 129}),
                       bytes(20, 0xFF)};
  for (const bytes& row : bad)
    EXPECT_EQ(provision(row), TEEC_ERROR_BAD_PARAMETERS) << row.size();

  const bytes good = record({20, 0, 30, 4, 5});
  TEEC_Result res = TEEC_ERROR_GENERIC;
  for (uint64_t n = 1; res != TEEC_SUCCESS && n < 100; n++) {
    tee::host::fail_nth_call(n, TEE_ERROR_OUT_OF_MEMORY);
    res = provision(good);
    EXPECT_EQ(res != TEEC_SUCCESS, tee::host::fault_fired()) << n;
    tee::host::clear_fault();
  }
  EXPECT_EQ(provision(good), TEEC_ERROR_ACCESS_CONFLICT);
  ta.restart();
  EXPECT_EQ(provision(good), TEEC_ERROR_ACCESS_CONFLICT);
}

}  // namespace
}  // namespace keymaster::test
