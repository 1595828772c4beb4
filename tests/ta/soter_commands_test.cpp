// The SOTER commands: the ATTK, the device's identifier, reports of fingerprints; and vaults that
// misbehave.
#include <openssl/pem.h>

#include "ta/soter_device.h"

namespace keymaster::test {
namespace {

constexpr uint32_t GENERATE = 0xFF00;
constexpr uint32_t CHECK = 0xFF01;
constexpr uint32_t EXPORT = 0xFF02;
constexpr uint32_t DEVICE_ID = 0xFF03;
constexpr uint32_t SET_FID = 0xFF04;

bytes spki_of(byte_view pem) {
  const std::unique_ptr<BIO, decltype(&BIO_free)> in(
      BIO_new_mem_buf(pem.data(), static_cast<int>(pem.size())), BIO_free);
  EVP_PKEY* key = PEM_read_bio_PUBKEY(in.get(), nullptr, nullptr, nullptr);
  bytes spki(1024);
  uint8_t* end = spki.data();
  spki.resize(key == nullptr ? 0 : static_cast<size_t>(i2d_PUBKEY(key, &end)));
  EVP_PKEY_free(key);
  return spki;
}

TEST_F(soter_device, WhatTheFactoryGaveIsServed) {
  load();
  request with_argument = soter_request(GENERATE);
  with_argument.a = 77;
  EXPECT_TRUE(succeeded(ta.send(with_argument)));
  EXPECT_TRUE(succeeded(ta.send(soter_request(CHECK))));
  const reply pem = ta.send(soter_request(EXPORT));
  ASSERT_TRUE(succeeded(pem));
  const byte_view text = pem.output();
  const std::string end = "\n-----END PUBLIC KEY-----";
  EXPECT_TRUE(std::ranges::equal(
      text.last(end.size() + 1),
      byte_view(client::as_bytes(std::string_view(end.c_str(), end.size() + 1)))));
  EXPECT_EQ(pkey::rsa_public(spki_of(text.first(text.size() - 1))).number(OSSL_PKEY_PARAM_RSA_N),
            attk().number(OSSL_PKEY_PARAM_RSA_N));
  const reply id = ta.send(soter_request(DEVICE_ID));
  EXPECT_EQ(client::copy_of(id.output()), client::copy_of(client::as_bytes("0123456789abcdef")));
}

TEST_F(soter_device, OutputsOfEverySizeAreRespected) {
  load();
  const struct {
    uint32_t id;
    int32_t too_small;
  } rows[] = {{EXPORT, -1000}, {DEVICE_ID, -29}};
  for (const auto& row : rows) {
    const size_t size = ta.send(soter_request(row.id)).output_size;
    for (size_t capacity = 0; capacity <= size + 1; capacity++) {
      const reply answer = ta.send(soter_request(row.id, capacity));
      EXPECT_EQ(answer.res, TEEC_SUCCESS);
      EXPECT_EQ(answer.km_error, capacity < size ? row.too_small : 0) << row.id << " " << capacity;
      EXPECT_EQ(answer.output_size, answer.ok() ? size : 0);
    }
  }
}

TEST_F(soter_device, AnExportWantsABuffer) {
  client::connection keymaster(client::context(ta.path()), client::KEYMASTER_UUID);
  client::parameter_slots slots{};
  const client::status outcome = keymaster.invoke(
      EXPORT, TEEC_PARAM_TYPES(TEEC_VALUE_OUTPUT, 0, TEEC_MEMREF_TEMP_OUTPUT, 0), &slots);
  EXPECT_TRUE(outcome.ok());
  EXPECT_EQ(static_cast<int32_t>(slots[0].value.a), -38);
}

TEST_F(soter_device, FailuresOfThePlatformAreReportedAndLeaveNothing) {
  for (const uint32_t id : {GENERATE, CHECK, EXPORT, DEVICE_ID}) {
    bool fired = true;
    for (uint64_t n = 1; fired; n++) {
      ta.restart();
      tee::host::fail_nth_call(n, TEE_ERROR_STORAGE_NOT_AVAILABLE);
      if (id == GENERATE || id == EXPORT) ta.expect_loading();
      const reply answer = ta.send(soter_request(id));
      fired = tee::host::fault_fired();
      tee::host::clear_fault();
      EXPECT_EQ(answer.res, TEEC_SUCCESS);
      EXPECT_TRUE(!fired || answer.km_error != 0 || id == CHECK) << id << " " << n;
      if (!fired) break;
      ta.expect_loading();
      EXPECT_TRUE(succeeded(ta.send(soter_request(id)))) << id << " " << n;
    }
  }
}

TEST(Soter, WithoutItsDataEveryCommandSaysSo) {
  ta_under_test ta;
  const struct {
    uint32_t id;
    int32_t error;
  } rows[] = {{GENERATE, -1000}, {CHECK, -1}, {EXPORT, -1}, {DEVICE_ID, -1000}};
  for (const auto& row : rows)
    EXPECT_TRUE(refused(ta.send(soter_request(row.id)), row.error)) << row.id;
}

bytes notification(uint32_t version, uint32_t fid, uint64_t time) {
  client::field_writer out;
  return out.u32(version).u32(fid).u64(time).take();
}

TEST_F(fake_device, OnlyTheFingerprintApplicationReportsFingers) {
  const bytes good = notification(0, 7, START_SYSTEM_MS);
  bytes shorter = good;
  shorter.pop_back();
  bytes longer = good;
  longer.push_back(0);
  const struct {
    TEEC_UUID from;
    bytes record;
    TEEC_Result res;
  } rows[] = {
      {FINGERPRINT_TA_UUID, good, TEEC_SUCCESS},
      {VAULT_TA_UUID, good, TEEC_ERROR_ACCESS_DENIED},
      {FINGERPRINT_TA_UUID, shorter, TEEC_ERROR_BAD_PARAMETERS},
      {FINGERPRINT_TA_UUID, longer, TEEC_ERROR_BAD_PARAMETERS},
      {FINGERPRINT_TA_UUID, notification(1, 7, START_SYSTEM_MS), TEEC_ERROR_BAD_FORMAT},
  };
  for (const auto& row : rows)
    EXPECT_EQ(tell(row.from, FAKE_FORWARD, row.record), row.res);
  EXPECT_TRUE(failed_with(ta.send({.id = SET_FID, .input = good}), TEEC_ERROR_ACCESS_DENIED));
  EXPECT_EQ(ta.trace().errors(), "soter_handle_setFid: soter deny finger print ta");
}

// Items of a TLV box.
using items = std::vector<std::pair<uint16_t, bytes>>;

bytes box(const items& content) {
  bytes out;
  for (const auto& [tag, value] : content) {
    for (const size_t number : {size_t{tag}, value.size()}) {
      out.push_back(static_cast<uint8_t>(number));
      out.push_back(static_cast<uint8_t>(number >> 8));
    }
    client::append(&out, value);
  }
  return out;
}

bytes cut(bytes whole, size_t bytes_off) {
  whole.resize(whole.size() - bytes_off);
  return whole;
}

items key_items(const pkey& key, size_t count = 8) {
  const char* const names[] = {OSSL_PKEY_PARAM_RSA_N,         OSSL_PKEY_PARAM_RSA_E,
                               OSSL_PKEY_PARAM_RSA_D,         OSSL_PKEY_PARAM_RSA_FACTOR1,
                               OSSL_PKEY_PARAM_RSA_FACTOR2,   OSSL_PKEY_PARAM_RSA_EXPONENT1,
                               OSSL_PKEY_PARAM_RSA_EXPONENT2, OSSL_PKEY_PARAM_RSA_COEFFICIENT1};
  items result;
  for (uint16_t i = 0; i < count; i++)
    result.emplace_back(static_cast<uint16_t>(17 + i), key.number(names[i]));
  return result;
}

items with_extra(items content, uint16_t tag, bytes value) {
  content.emplace_back(tag, std::move(value));
  return content;
}

constexpr uint32_t ASK_KEY = 2;
constexpr uint32_t ASK_PROPERTIES = 0x00001834;
constexpr uint32_t ASK_CPU_ID = 0x173A1734;
constexpr uint32_t FOR_EVER = 0xFFFFFFFF;

class Vault : public fake_device {
 protected:
  const items props = {{6197, bytes(3, 'n')}, {6198, bytes(3, 'v')}, {6199, bytes(16, 9)}};

  void program_well() {
    program({ASK_KEY, 0, 0, 0}, box(key_items(attk())));
    program({ASK_PROPERTIES, 0, 0, 0}, box(props));
    program({ASK_CPU_ID, 0, 0, 0}, bytes(64, 'c'));
  }
  int32_t export_error() {
    ta.expect_loading();
    return ta.send(soter_request(EXPORT)).km_error;
  }
};

TEST_F(Vault, AnswersThatMisbehaveKeepNothing) {
  const items key = key_items(attk());
  const items twice = with_extra(key, 17, bytes(256, 0xFF));
  items no_e = key;
  no_e.erase(no_e.begin() + 1);
  items wide = key_items(attk(), 3);  // of 4096 bits, as far as anyone can tell who has no factors
  wide[0].second.assign(512, 0xC5);
  items uuid_15 = props;
  uuid_15[2].second.pop_back();
  items no_version = props;
  no_version.erase(no_version.begin() + 1);
  const struct {
    const char* name;
    fake_answer how;
    bytes content;
    int32_t check, exported;  // what 0xFF01 and 0xFF02 answer
  } rows[] = {
      {"as it should be", {ASK_KEY, 0, 0, 0}, box(key), 0, 0},
      {"n, e and d alone", {ASK_KEY, 0, 0, 0}, box(key_items(attk(), 3)), 0, 0},
      {"a repeated item", {ASK_KEY, 0, 0, 0}, box(twice), 0, 0},
      {"not provisioned", {ASK_KEY, TEE_ERROR_ITEM_NOT_FOUND, FOR_EVER, 0}, {}, -1, -1},
      {"busy", {ASK_KEY, TEE_ERROR_BUSY, FOR_EVER, 0}, {}, -2, -1},
      {"out of memory for ever", {ASK_KEY, TEE_ERROR_OUT_OF_MEMORY, FOR_EVER, 0}, {}, -2, -1},
      {"out of memory twice", {ASK_KEY, TEE_ERROR_OUT_OF_MEMORY, 2, 0}, box(key), 0, 0},
      {"a length above the buffer", {ASK_KEY, 0, 0, 8192}, box(key), -2, -1},
      {"no item", {ASK_KEY, 0, 0, 0}, {}, -2, -1},
      {"no e", {ASK_KEY, 0, 0, 0}, box(no_e), -2, -1},
      {"a cut last item", {ASK_KEY, 0, 0, 0}, cut(box(key), 1), -2, -1},
      {"1024 bits", {ASK_KEY, 0, 0, 0}, box(key_items(pkey::rsa(1024))), 0, 0},
      {"4096 bits", {ASK_KEY, 0, 0, 0}, box(wide), 0, -1000},
      {"no properties", {ASK_PROPERTIES, TEE_ERROR_ITEM_NOT_FOUND, FOR_EVER, 0}, {}, 0, -1},
      {"long properties", {ASK_PROPERTIES, 0, 0, 600}, box(props), 0, -1},
      {"a short UUID", {ASK_PROPERTIES, 0, 0, 0}, box(uuid_15), 0, -1},
      {"no sensor version", {ASK_PROPERTIES, 0, 0, 0}, box(no_version), 0, -1},
      {"cut properties", {ASK_PROPERTIES, 0, 0, 0}, cut(box(props), 16), 0, -1},
      {"no CPU id", {ASK_CPU_ID, TEE_ERROR_SHORT_BUFFER, FOR_EVER, 0}, {}, 0, -1},
      {"a long CPU id", {ASK_CPU_ID, 0, 0, 1}, bytes(64, 'c'), 0, -1},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.name);
    restart();
    program_well();
    program(row.how, row.content);
    EXPECT_EQ(ta.send(soter_request(CHECK)).km_error, row.check);
    EXPECT_EQ(export_error(), row.exported);
    // Nothing was kept of what failed: the next call asks again, and is served.
    program_well();
    if (row.exported == -1) {
      EXPECT_EQ(export_error(), 0);
    }
  }
}

}  // namespace
}  // namespace keymaster::test
