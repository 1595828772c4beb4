// The SOTER commands: the ATTK, the device's identifier, reports of fingerprints; and vaults that
// misbehave.
#include <algorithm>

#include "ta/soter_device.h"

namespace keymaster::test {
namespace {

enum : uint32_t { GENERATE = 0xFF00, CHECK, EXPORT, DEVICE_ID, SET_FID };

TEST_F(soter_device, WhatTheFactoryGaveIsServed) {
  load();
  request with_argument = soter_request(GENERATE);
  with_argument.a = 77;
  EXPECT_TRUE(succeeded(ta.send(with_argument)));
  EXPECT_TRUE(succeeded(ta.send(soter_request(CHECK))));
  const reply pem = ta.send(soter_request(EXPORT));
  ASSERT_TRUE(succeeded(pem));
  const std::string_view end("\n-----END PUBLIC KEY-----\0", 26);
  EXPECT_TRUE(std::ranges::equal(pem.output().last(end.size()), client::as_bytes(end)));
  EXPECT_TRUE(std::ranges::equal(ta.send(soter_request(DEVICE_ID)).output(),
                                 client::as_bytes("0123456789abcdef")));
}

TEST_F(soter_device, OutputsOfEverySizeAreRespected) {
  load();
  for (const auto& [id, too_small] : {std::pair{EXPORT, -1000}, {DEVICE_ID, -29}}) {
    const size_t size = ta.send(soter_request(id)).output_size;
    for (size_t capacity = 0; capacity <= size + 1; capacity++) {
      const reply answer = ta.send(soter_request(id, capacity));
      EXPECT_TRUE(refused(answer, capacity < size ? too_small : 0)) << id << " " << capacity;
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
    SCOPED_TRACE(id);
    const auto fresh = [&] {
      ta.restart();
      if (id == GENERATE || id == EXPORT) ta.expect_loading();
      return soter_request(id);
    };
    ta.fail_each_call(TEE_ERROR_STORAGE_NOT_AVAILABLE, fresh, [&](const reply& answer, bool fired) {
      EXPECT_EQ(answer.res, TEEC_SUCCESS);
      EXPECT_TRUE(!fired || answer.km_error != 0 || id == CHECK);
      if (fired) ta.expect_loading();
      EXPECT_TRUE(succeeded(ta.send(soter_request(id))));
    });
  }
}

TEST(Soter, WithoutItsDataEveryCommandSaysSo) {
  ta_under_test ta;
  for (const auto& [id, error] :
       {std::pair{GENERATE, -1000}, {CHECK, -1}, {EXPORT, -1}, {DEVICE_ID, -1000}}) {
    EXPECT_TRUE(refused(ta.send(soter_request(id)), error)) << id;
  }
}

bytes cut(bytes whole, size_t bytes_off) {
  whole.resize(whole.size() - bytes_off);
  return whole;
}

// Items of a TLV box.
using items = std::vector<std::pair<uint16_t, bytes>>;

bytes box(const items& content) {
  client::field_writer out;
  for (const auto& [tag, value] : content)
    out.u32(static_cast<uint32_t>(value.size() << 16 | tag)).raw(value);
  return out.take();
}

items key_items(const pkey& key, size_t count = 8) {
  const bytes numbers = key.import_data();
  client::field_reader in(numbers);
  items result;
  for (uint16_t i = 0; i < count; i++)
    result.emplace_back(static_cast<uint16_t>(17 + i), client::copy_of(in.field()));
  return result;
}

items without_item(items content, size_t index) {
  content.erase(content.begin() + static_cast<ptrdiff_t>(index));
  return content;
}

constexpr uint32_t ASK_KEY = 2;
constexpr uint32_t ASK_PROPERTIES = 0x00001834;
constexpr uint32_t ASK_CPU_ID = 0x173A1734;
constexpr uint32_t FOR_EVER = 0xFFFFFFFF;

bytes notification(uint32_t version, uint32_t fid) {
  return client::field_writer().u32(version).u32(fid).u64(START_SYSTEM_MS).take();
}

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

TEST_F(Vault, OnlyTheFingerprintApplicationReportsFingers) {
  program_well();
  EXPECT_EQ(export_error(), 0);
  const bytes other = notification(0, 8);
  const std::tuple<TEEC_UUID, bytes, TEEC_Result> rows[] = {
      {FINGERPRINT_TA_UUID, notification(0, 7), TEEC_SUCCESS},
      {VAULT_TA_UUID, other, TEEC_ERROR_ACCESS_DENIED},
      {FINGERPRINT_TA_UUID, cut(other, 1), TEEC_ERROR_BAD_PARAMETERS},
      {FINGERPRINT_TA_UUID, bytes(17), TEEC_ERROR_BAD_PARAMETERS},
      {FINGERPRINT_TA_UUID, notification(1, 8), TEEC_ERROR_BAD_FORMAT},
  };
  for (const auto& [from, record, res] : rows)
    EXPECT_EQ(tell(from, FAKE_FORWARD, record), res);
  EXPECT_TRUE(failed_with(ta.send({.id = SET_FID, .input = other}), TEEC_ERROR_ACCESS_DENIED));
  EXPECT_EQ(ta.trace().errors(), "soter_handle_setFid: soter deny finger print ta");
  // What was refused leaves the finger before it in place.
  const bytes blob = ta.import(soter_key(), attk().import_data());
  const bytes made = finished(ta.finish(ta.begun(SIGN, blob, soter_use())));
  EXPECT_TRUE(client::parse_signed_document(made).text().starts_with(R"({"raw":"","fid":7,)"));
}

TEST_F(Vault, AnswersThatMisbehaveKeepNothing) {
  const items key = key_items(attk());
  items twice = key;
  twice.emplace_back(17, bytes(256, 0xFF));
  items wide = key_items(attk(), 3);  // of 4096 bits, as far as anyone can tell who has no factors
  wide[0].second.assign(512, 0xC5);
  items padded = key;
  for (auto& [tag, number] : padded)
    number.insert(number.begin(), 300, 0);
  items long_d = key_items(attk(), 3);
  long_d[2].second.insert(long_d[2].second.begin(), 1);
  items uuid_15 = props;
  uuid_15[2].second.pop_back();
  // What the vault answers, and what 0xFF01 and 0xFF02 make of it.
  const std::tuple<const char*, fake_answer, bytes, int32_t, int32_t> rows[] = {
      {"as it should be", {ASK_KEY, 0, 0, 0}, box(key), 0, 0},
      {"n, e and d alone", {ASK_KEY, 0, 0, 0}, box(key_items(attk(), 3)), 0, 0},
      {"a repeated item", {ASK_KEY, 0, 0, 0}, box(twice), 0, 0},
      {"not provisioned", {ASK_KEY, TEE_ERROR_ITEM_NOT_FOUND, FOR_EVER, 0}, {}, -1, -1},
      {"busy", {ASK_KEY, TEE_ERROR_BUSY, FOR_EVER, 0}, {}, -2, -1},
      {"out of memory for ever", {ASK_KEY, TEE_ERROR_OUT_OF_MEMORY, FOR_EVER, 0}, {}, -2, -1},
      {"out of memory twice", {ASK_KEY, TEE_ERROR_OUT_OF_MEMORY, 2, 0}, box(key), 0, 0},
      {"a length above the buffer", {ASK_KEY, 0, 0, 8192}, box(key), -2, -1},
      {"no item", {ASK_KEY, 0, 0, 0}, {}, -2, -1},
      {"no e", {ASK_KEY, 0, 0, 0}, box(without_item(key, 1)), -2, -1},
      {"a cut last item", {ASK_KEY, 0, 0, 0}, cut(box(key), 1), -2, -1},
      {"1024 bits", {ASK_KEY, 0, 0, 0}, box(key_items(pkey::rsa(1024))), 0, 0},
      {"4096 bits", {ASK_KEY, 0, 0, 0}, box(wide), 0, -1000},
      {"leading zeros", {ASK_KEY, 0, 0, 0}, box(padded), 0, 0},
      {"a private exponent beyond the modulus", {ASK_KEY, 0, 0, 0}, box(long_d), 0, -1000},
      {"no properties", {ASK_PROPERTIES, TEE_ERROR_ITEM_NOT_FOUND, FOR_EVER, 0}, {}, 0, -1},
      {"long properties", {ASK_PROPERTIES, 0, 0, 600}, box(props), 0, -1},
      {"a short UUID", {ASK_PROPERTIES, 0, 0, 0}, box(uuid_15), 0, -1},
      {"no sensor version", {ASK_PROPERTIES, 0, 0, 0}, box(without_item(props, 1)), 0, -1},
      {"cut properties", {ASK_PROPERTIES, 0, 0, 0}, cut(box(props), 16), 0, -1},
      {"no CPU id", {ASK_CPU_ID, TEE_ERROR_SHORT_BUFFER, FOR_EVER, 0}, {}, 0, -1},
      {"a long CPU id", {ASK_CPU_ID, 0, 0, 1}, bytes(64, 'c'), 0, -1},
  };
  for (const auto& [name, how, content, check, exported] : rows) {
    SCOPED_TRACE(name);
    restart();
    program_well();
    program(how, content);
    EXPECT_EQ(ta.send(soter_request(CHECK)).km_error, check);
    EXPECT_EQ(export_error(), exported);
    // Nothing was kept of what failed: the next call asks again, and is served.
    program_well();
    EXPECT_EQ(export_error(), exported == -1 ? 0 : exported);
  }
}

}  // namespace
}  // namespace keymaster::test
