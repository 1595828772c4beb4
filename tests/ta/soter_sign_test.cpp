// The documents of SOTER keys, byte by byte, on a device that the factory has provisioned: what a
// sign operation makes of a message, and what the export of a key is. libcrypto verifies.
#include <set>

#include "support/blob_forge.h"
#include "ta/soter_device.h"

namespace keymaster::test {
namespace {

using namespace std::string_literals;
using client::as_bytes;

constexpr scheme UNDIGESTED = {KM_PAD_RSA_PKCS1_1_5_SIGN, KM_DIGEST_NONE};

const pkey& key_1024() {
  static const pkey key = pkey::rsa(1024);
  return key;
}

// The last member of an export document and the end of the document.
std::string public_key_member(byte_view spki) {
  std::string base64(spki.size() * 4 / 3 + 4, '\0');
  base64.resize(EVP_EncodeBlock(reinterpret_cast<uint8_t*>(base64.data()), spki.data(),
                                static_cast<int>(spki.size())));
  std::string text = R"("pub_key":"-----BEGIN PUBLIC KEY-----\n)";
  for (size_t i = 0; i < base64.size(); i++) {
    text += base64[i] == '/' ? "\\/" : std::string(1, base64[i]);
    if (i % 64 == 63 || i + 1 == base64.size()) text += "\\n";
  }
  return text + R"(-----END PUBLIC KEY-----"})";
}

// The end of every signed document of the device.
const std::string DEVICE =
    R"("tee_n":"Keymaster","tee_v":"0.1.0","fp_n":"s","fp_v":"2","cpu_id":"c"})";

const param_set BY_ATTK = one(KM_TAG_SOTER_ATTK_SIGNS, 1);

class SoterDocument : public soter_device {
 protected:
  SoterDocument() { load(); }

  // The blob of a SOTER key of 1024 bits.
  bytes made(const param_set& more = {}, scheme how = PKCS1) {
    return ta.import(soter_key(more, how), key_1024().import_data());
  }

  // What finish answers to a message, and what it puts out when it must succeed.
  reply sign(byte_view blob, scheme how, std::string_view message, const param_set& last = {}) {
    const uint32_t handle = ta.begun(KM_PURPOSE_SIGN, blob, soter_use(how));
    EXPECT_TRUE(succeeded(ta.update(handle, as_bytes(message))));
    return ta.send(step_request(command::FINISH, handle, {}, last, message.size() + AMPLE));
  }
  client::signed_document signed_by(byte_view blob, scheme how, std::string_view message) {
    const reply answer = sign(blob, how, message);
    EXPECT_TRUE(succeeded(answer)) << ta.trace().errors();
    return parsed(answer);
  }
  void expect_signed(byte_view blob, std::string_view message, const std::string& members) {
    EXPECT_EQ(signed_by(blob, PKCS1, message).text(), "{" + members + DEVICE);
  }
  static client::signed_document parsed(const reply& finished) {
    return client::parse_signed_document(client::field_reader(finished.output()).field());
  }

  // The document of the key's export when there is one; export itself always succeeds.
  std::optional<client::signed_document> exported(byte_view blob) {
    const reply answer = ta.send_well(key_request(command::EXPORT_KEY, blob));
    if (answer.output_size == 0) return std::nullopt;
    return client::parse_signed_document(answer.output());
  }
};

TEST_F(SoterDocument, HoldsWhatTheDeviceKnows) {
  const bytes blob = made();
  report_finger(4294967295);
  const auto first = signed_by(blob, PKCS1, "a/b \"\xc3\xa9\"\n\x01");
  EXPECT_EQ(
      first.text(),
      "{\"raw\":\"a\\/b \\\"\xc3\xa9\\\"\\n\x01\",\"fid\":4294967295,\"counter\":1,\"uid\":0," +
          DEVICE);
  // The zero byte is signed.
  EXPECT_EQ(first.document.back(), 0);
  EXPECT_TRUE(key_1024().verify(PKCS1, first.document, first.signature));
  EXPECT_FALSE(key_1024().verify(PKCS1, as_bytes(first.text()), first.signature));

  ta_under_test::advance(3000);
  expect_signed(blob, "", R"("raw":"","fid":4294967295,"counter":2,"uid":0,)");
  ta_under_test::advance(1);
  expect_signed(blob, "x", R"("raw":"x","counter":3,"uid":0,)");
  const auto stale = "produce_soter_sign_json: get finger id error ffff3001, continue without fid";
  EXPECT_TRUE(ta.trace().has(stale));

  // The user is the key's; what finish is given does not matter.
  report_finger(7);
  const param_set user = one(KM_TAG_SOTER_UID, 4000000000);
  expect_signed(made(user), "x", R"("raw":"x","fid":7,"counter":4,"uid":4000000000,)");
  EXPECT_EQ(parsed(sign(blob, PKCS1, "x", user)).text(),
            R"({"raw":"x","fid":7,"counter":5,"uid":0,)" + DEVICE);

  // A report from the future is none.
  tee::host::set_clocks(START_SYSTEM_MS + 3000, START_REE_MS);
  expect_signed(blob, "x", R"("raw":"x","counter":6,"uid":0,)");

  // A restart forgets the finger, not the counter.
  ta_under_test::advance(1);
  ta.restart();
  load();
  expect_signed(blob, "x", R"("raw":"x","counter":7,"uid":0,)");
  // Nor is there one just after a boot.
  tee::host::set_clocks(0, START_REE_MS);
  expect_signed(blob, "x", R"("raw":"x","counter":8,"uid":0,)");
}

TEST_F(SoterDocument, IsSignedWithEverySchemeOfTheKey) {
  constexpr int DIGEST_SIZES[] = {0, 16, 20, 28, 32, 48, 64};
  for (const pkey* key : {&key_1024(), &attk()}) {
    const auto signed_with = [&](scheme how) {
      return signed_by(ta.import(soter_key({}, how), key->import_data()), how, "message");
    };
    for (uint32_t digest = KM_DIGEST_MD5; digest <= KM_DIGEST_SHA_2_512; digest++) {
      const scheme pkcs1 = {KM_PAD_RSA_PKCS1_1_5_SIGN, digest};
      const auto plain = signed_with(pkcs1);
      EXPECT_EQ(plain.signature.size(), key->size());
      EXPECT_TRUE(key->verify(pkcs1, plain.document, plain.signature)) << digest;
      if (digest == KM_DIGEST_MD5) continue;
      // The salt is the longest, also where other keys' is as long as the digest.
      const scheme pss = {KM_PAD_RSA_PSS, digest};
      const int longest = static_cast<int>(key->size()) - DIGEST_SIZES[digest] - 2;
      const auto salted = signed_with(pss);
      EXPECT_TRUE(key->verify(pss, salted.document, salted.signature, longest)) << digest;
      EXPECT_FALSE(key->verify(pss, salted.document, salted.signature, DIGEST_SIZES[digest]));
    }
  }
}

TEST_F(SoterDocument, IsRefused) {
  const std::string no_text = "produce_soter_sign_json: Not a valid utf8 string, strlen(raw) ";
  const bytes blob = made();
  // A message, whether the counter moves, and what is traced.
  const std::tuple<scheme, std::string, bool, std::string> rows[] = {
      {PKCS1, "abc\0"s, false, no_text + "3 length 4"},
      {PKCS1, "\0abc"s, false, no_text + "0 length 4"},
      {PKCS1, "a\xed\xa0\x80", false, no_text + "4 length 4"},
      {PKCS1, "\xc3", false, "soter_enhance_sign_finish: produce json string error"},
      // Without a digest there is no signature for a document, however short it is.
      {UNDIGESTED, "", true, "rsa_sign_finish: soter enhance error ffff0007"},
      {UNDIGESTED, std::string(128, 'x'), true, "rsa_sign_finish: soter enhance error ffff000c"},
  };
  int counter = 0;
  for (const auto& [how, message, counted, trace] : rows) {
    const bytes refusing = made({}, how);
    EXPECT_TRUE(refused(sign(refusing, how, message), KM_ERROR_UNKNOWN_ERROR));
    EXPECT_TRUE(ta.trace().has(trace)) << ta.trace().errors();
    counter += counted ? 2 : 1;
    expect_signed(blob, "", R"("raw":"","counter":)" + std::to_string(counter) + R"(,"uid":0,)");
  }
}

TEST_F(SoterDocument, HoldsMessagesOfAnyLength) {
  const trace_capture lines(TEE_TRACE_DEBUG);
  const bytes blob = made();
  const uint32_t handle = ta.begun(KM_PURPOSE_SIGN, blob, soter_use(PKCS1));
  std::string message;
  for (const size_t size : {4096, 0, 1, 4095, 20000}) {
    const size_t end = message.size() + size;
    while (message.size() < end)
      message += static_cast<char>('a' + message.size() % 13);
    const reply answer = ta.update(handle, as_bytes(message).last(size));
    EXPECT_TRUE(succeeded(answer));
    EXPECT_EQ(answer.b, size);
    EXPECT_EQ(lines.has("rsa_sign_update: expand soter buf 4096 -> 8192"), end > 4096);
  }
  EXPECT_TRUE(lines.has("rsa_sign_update: expand soter buf 8192 -> 28192"));
  const auto document = parsed(ta.send_well(step_request(command::FINISH, handle, {}, {}, 40000)));
  EXPECT_EQ(document.text(), R"({"raw":")" + message + R"(","counter":1,"uid":0,)" + DEVICE);
  EXPECT_TRUE(key_1024().verify(PKCS1, document.document, document.signature));
}

// Every failed call is reported, but for those that set the two versions: the
// document then goes without. The counter never comes twice.
TEST_F(SoterDocument, FaultsOfSigning) {
  const bytes blob = made();
  signed_by(blob, PKCS1, "x");  // makes the counter
  uint64_t last = 1;
  std::set<std::string> passed_over;
  const auto finish = [&] {
    const uint32_t handle = ta.begun(KM_PURPOSE_SIGN, blob, soter_use(PKCS1));
    ta.update(handle, as_bytes("x"));
    return step_request(command::FINISH, handle);
  };
  ta.fail_each_call(TEE_ERROR_OUT_OF_MEMORY, finish, [&](const reply& answer, bool fired) {
    EXPECT_TRUE(answer.ok() || (fired && answer.output_size == 0));
    if (!answer.ok()) return;
    const std::string text(parsed(answer).text());
    std::string missing;
    for (const char* member : {"tee_v", "fp_v"})
      missing += text.find(member) == text.npos ? member : "";
    EXPECT_EQ(missing.empty(), !fired) << text;
    passed_over.insert(missing);
    const uint64_t counter = std::stoull(text.substr(text.find("counter") + 9));
    EXPECT_GT(counter, last);
    last = counter;
  });
  EXPECT_EQ(passed_over, (std::set<std::string>{"", "tee_v", "fp_v"}));
}

class SoterExport : public SoterDocument {
 protected:
  static param_set by_blob(byte_view blob, keymaster_tag_t tag = KM_TAG_SOTER_SIGN_KEY_BLOB) {
    return one(KM_TAG_SOTER_KEY_SIGNS, 1).add_bytes(tag, blob);
  }
  static param_set by_name(byte_view blob) { return by_blob(blob, KM_TAG_SOTER_SIGN_KEY_NAME); }

  const bytes signer = ta.import(soter_key(), attk().import_data());
  const bytes small_signer = made();
};

TEST_F(SoterExport, IsSignedByWhomTheKeySays) {
  const pkey large = pkey::rsa(3072);
  const bytes large_signer = ta.import(soter_key(), large.import_data());
  const bytes rsa_record = client::field_writer().u32(2048).raw(attk().import_data()).take();
  const bytes plain_key =
      ta.import(without(soter_key(), KM_TAG_SOTER_KEY), key_1024().import_data());
  const std::string public_key =
      public_key_member(ta.send(key_request(command::EXPORT_KEY, plain_key)).output());
  const struct {
    const char* name;
    param_set extra;
    const pkey* signed_by;    // null: there is no document
    std::string detail = {};  // the members before the public key, or what is traced
  } rows[] = {
      {"attk", BY_ATTK, &attk()},
      {"blob", by_blob(signer), &attk()},
      {"name", by_name(small_signer), &key_1024()},
      {"large", by_blob(large_signer), &large},
      {"blob before name", by_blob(small_signer).append(by_name(signer)), &key_1024()},
      {"attk before blob", by_blob(small_signer).append(BY_ATTK), &attk()},
      {"counter", param_set(BY_ATTK).add_flag(KM_TAG_SOTER_COUNTER), &attk(), R"("counter":1,)"},
      {"uid", param_set(BY_ATTK).add(KM_TAG_SOTER_UID, 5), &attk(), R"("uid":5,)"},
      {"counter and uid",
       param_set(BY_ATTK).add(KM_TAG_SOTER_UID, 0).add_flag(KM_TAG_SOTER_COUNTER), &attk(),
       R"("counter":2,"uid":0,)"},
      {"nobody", {}, nullptr},
      {"blob without its flag", param_set().add_bytes(KM_TAG_SOTER_SIGN_KEY_BLOB, signer), nullptr},
      {"flag without a blob", one(KM_TAG_SOTER_KEY_SIGNS, 1), nullptr, "no sign key with key blob"},
      {"no blob at all", by_blob(bytes(200, 1)), nullptr, "Sign key is null"},
      {"no RSA key", by_blob(ta.generate(hmac_key(256))), nullptr, "Sign key is null"},
      {"not by its algorithm", by_blob(seal(blob_plaintext(rsa_record, hmac_key()))), nullptr,
       "Sign key is null"},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.name);
    const bytes blob = made(row.extra);
    const auto document = exported(blob);
    ASSERT_EQ(document.has_value(), row.signed_by != nullptr);
    if (!document) {
      EXPECT_EQ(ta.trace().has("soter_enhance_export_key: " + row.detail), !row.detail.empty());
      continue;
    }
    EXPECT_EQ(document->text(), "{" + row.detail + public_key);
    EXPECT_EQ(document->signature.size(), row.signed_by->size());
    EXPECT_TRUE(row.signed_by->verify(PKCS1, document->document, document->signature));
  }
  // A key of another algorithm that says it is SOTER's.
  EXPECT_FALSE(exported(ta.generate(hmac_key(256).add_flag(KM_TAG_SOTER_KEY).append(BY_ATTK))));
}

TEST_F(SoterExport, RespectsTheOutput) {
  const bytes blob = made(BY_ATTK);
  const size_t needed = ta.send(key_request(command::EXPORT_KEY, blob)).output_size;
  for (const size_t capacity : {size_t{0}, size_t{4}, needed - 1, needed, needed + 1}) {
    const reply answer = ta.send_well(key_request(command::EXPORT_KEY, blob, {}, capacity));
    EXPECT_EQ(answer.output_size, capacity < needed ? 0 : needed);
    EXPECT_TRUE(capacity >= needed || answer.buffer == bytes(capacity, UNTOUCHED));
  }
}

TEST_F(SoterExport, FaultsLeaveNoDocument) {
  for (const param_set& extra :
       {param_set(BY_ATTK).add_flag(KM_TAG_SOTER_COUNTER).add(KM_TAG_SOTER_UID, 1),
        by_blob(signer)}) {
    const bytes blob = made(extra);
    exported(blob);
    ta.fail_each_call(
        TEE_ERROR_OUT_OF_MEMORY, [&] { return key_request(command::EXPORT_KEY, blob); },
        [](const reply& answer, bool fired) {
          EXPECT_EQ(answer.ok() && answer.output_size != 0, !fired);
          EXPECT_TRUE(!fired || answer.buffer == bytes(AMPLE, UNTOUCHED));
        });
  }
}

// Without the factory's data no operation begins, and no document is signed with the ATTK.
TEST(SoterUnprovisioned, HasNoDocuments) {
  ta_under_test ta;
  const bytes blob = ta.import(soter_key(BY_ATTK), key_1024().import_data());
  EXPECT_TRUE(refused(ta.begin(KM_PURPOSE_SIGN, blob, soter_use(PKCS1)), KM_ERROR_UNKNOWN_ERROR));
  EXPECT_TRUE(ta.trace().has("create_rsa_sign: soter resources is not ready, error 0xffff0008"))
      << ta.trace().errors();
  EXPECT_EQ(ta.send_well(key_request(command::EXPORT_KEY, blob)).output_size, 0u);
  EXPECT_TRUE(ta.trace().has("soter_enhance_export_key: soter is not ready"));
}

}  // namespace
}  // namespace keymaster::test
