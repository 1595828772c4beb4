// Devices that the factory prepared for SOTER, and those whose siblings misbehave.
#pragma once

#include "keymaster/client/soter.h"
#include "keymaster/client/vault.h"
#include "support/sets.h"
#include "support/ta_folders.h"
#include "ta/fake_sibling/fake_sibling.h"
#include "ta/pkey.h"

namespace keymaster::test {

// The ATTK of the devices here.
inline const pkey& attk() {
  static const pkey key = pkey::rsa(2048);
  return key;
}

inline client::factory_data factory() {
  return {.attk = client::read_rsa_numbers(attk().import_data()),
          .fingerprint_name = "s",
          .fingerprint_version = "2",
          .cpu_id = "c",
          .device_id = "0123456789abcdef",
          .ta_data = {}};
}

// The SOTER commands; their error codes are in slot 0.
inline request soter_request(uint32_t id, size_t capacity = AMPLE) {
  return {.id = id, .capacity = id == 0xFF02 || id == 0xFF03 ? capacity : 0};
}

// A SOTER key for `digest` and `padding`, with more tags; and what begin with it asks for.
constexpr scheme PKCS1 = {KM_PAD_RSA_PKCS1_1_5_SIGN, KM_DIGEST_SHA_2_256};
inline param_set soter_use(scheme how = PKCS1) {
  return one(KM_TAG_PADDING, how.padding).add(KM_TAG_DIGEST, how.digest);
}
inline param_set soter_key(const param_set& more = {}, scheme how = PKCS1) {
  return one(KM_TAG_ALGORITHM, KM_ALGORITHM_RSA)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN)
      .append(soter_use(how))
      .add_flag(KM_TAG_NO_AUTH_REQUIRED)
      .add_flag(KM_TAG_SOTER_KEY)
      .append(more);
}

// soter_device: a device whose vault holds factory().
class soter_device : public testing::Test {
 protected:
  soter_device() {
    EXPECT_TRUE(client::vault(client::context(ta.path())).provision(factory()).ok());
  }

  // Has the TA fetch what it keeps.
  void load() {
    ta.expect_loading();
    EXPECT_TRUE(succeeded(ta.send(soter_request(0xFF00))));
  }
  void report_finger(uint32_t fid) {
    EXPECT_TRUE(client::fingerprint_sensor(client::context(ta.path())).report_match(fid).ok());
  }

  ta_under_test ta;
};

// fake_device: its vault and its fingerprint TA are fakes, which forget what they were told when
// the device restarts.
class fake_device : public testing::Test {
 protected:
  fake_device() {
    use_ta_folders(TEST_TA_PATH);
    restart();
  }
  ~fake_device() override {
    siblings.reset();
    use_own_tas();
  }

  // New instances of all.
  void restart() {
    siblings.reset();
    ta.restart();
    siblings.emplace(ta.path());
  }
  TEEC_Result tell(const TEEC_UUID& sibling, uint32_t command, bytes memory) {
    client::connection connection(*siblings, sibling);
    client::parameter_slots slots{};
    slots[0].tmpref = {memory.data(), memory.size()};
    return connection.invoke(command, TEEC_MEMREF_TEMP_INPUT, &slots).tee;
  }
  // See fake_sibling.h.
  void program(fake_answer how, byte_view content = {}) {
    bytes memory = client::copy_of({reinterpret_cast<const uint8_t*>(&how), sizeof(how)});
    client::append(&memory, content);
    EXPECT_EQ(tell(VAULT_TA_UUID, FAKE_PROGRAM, memory), TEEC_SUCCESS);
  }

  ta_under_test ta;
  std::optional<client::context> siblings;  // keeps their instances alive
};

}  // namespace keymaster::test
