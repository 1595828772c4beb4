// SOTER on the command line: provisioning, the ATTK, and documents that openssl verifies.
#include <cstdlib>
#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include "run.h"
#include "tee/device/device.h"
#include "tee/device/uuid.h"

namespace {

using nlohmann::json;
using words = std::vector<std::string>;

enum { DONE, REFUSED, WRONG_USAGE, TEE_FAILED };

// A sandbox with a device whose ATTK lies in attk (private) and attk.pub (public).
class KmtoolSoter : public testing::Test {
 protected:
  void SetUp() override {
    openssl("genpkey -algorithm RSA -pkeyopt rsa_keygen_bits:2048 -out attk");
    openssl("pkey -in attk -pubout -out attk.pub");
    box.write("m", "pay/10\x01");
    expect({"device", "create", "--os-version", "130000", "--attk", "attk", "--fp-name", "sensor",
            "--fp-version", "2", "--cpu-id", "cpu", "--device-id", "serial 1"},
           DONE, "");
  }
  void openssl(const std::string& arguments, int exit_code = 0) {
    const std::string line =
        "cd '" + box.path("") + "' && openssl " + arguments + " >.openssl 2>&1";
    EXPECT_EQ(WEXITSTATUS(std::system(line.c_str())), exit_code)
        << arguments << ": " << box.read(".openssl");
  }
  void expect(const words& arguments, int exit_code, const std::string& message) {
    const call_result result = box.run(arguments);
    EXPECT_EQ(result.exit_code, exit_code) << testing::PrintToString(arguments) << result.err;
    EXPECT_NE((result.out + result.err).find(message), std::string::npos)
        << testing::PrintToString(arguments) << result.out << result.err;
  }
  json run_json(words arguments) {
    arguments.insert(arguments.begin(), "--json");
    return json::parse(box.run(arguments).out);
  }
  // The members of a document in a file, which must end with its zero byte.
  json document(const std::string& name) {
    std::string text = box.read(name);
    EXPECT_EQ(text.back(), '\0');
    text.pop_back();
    return json::parse(text);
  }
  sandbox box;
};

TEST_F(KmtoolSoter, DevicesAreProvisionedOnce) {
  expect({"soter", "check-attk"}, DONE, "ready");
  EXPECT_EQ(box.run({"soter", "export-attk"}).out, box.read("attk.pub"));
  EXPECT_EQ(box.run({"soter", "device-id"}).out, "serial 1\n");
  expect({"soter", "fingerprint", "3"}, DONE, "took the report");
  expect({"device", "provision"}, REFUSED, "provisioned before");

  tee::device_settings settings;
  settings.id = tee::new_uuid();
  tee::device::create(box.path("bare"), settings);
  expect({"--device", "bare", "soter", "check-attk"}, REFUSED, "no ATTK (-1)");
  expect({"--device", "bare", "soter", "export-attk"}, REFUSED, "kmtool device provision");
  expect({"--device", "bare", "soter", "device-id"}, REFUSED, "(-1000)");
  expect({"--device", "bare", "device", "provision"}, DONE, "");
  expect({"--device", "bare", "soter", "check-attk"}, DONE, "ready");
  EXPECT_EQ(run_json({"--device", "bare", "soter", "device-id"})["device_id"],
            tee::to_text(settings.id));
}

TEST_F(KmtoolSoter, DocumentsAreSplitAndVerified) {
  const words generate = {"generate", "rsa", "--soter", "--padding", "pkcs1-sign", "-o"};
  const auto generated = [&](const std::string& name, const words& more) {
    words call = generate;
    call.push_back(name);
    call.insert(call.end(), more.begin(), more.end());
    expect(call, DONE, "");
  };
  generated("k", {"--uid", "7", "--counter"});
  expect({"soter", "export", "k", "-o", "e", "--public-key", "k.pub"}, DONE, "e.sig");
  openssl("dgst -sha256 -verify attk.pub -signature e.sig e");
  expect({"soter", "verify", "e", "e.sig", "--key", "attk.pub"}, DONE, "\"counter\":1,\"uid\":7");
  EXPECT_EQ(std::string(document("e")["pub_key"]) + "\n", box.read("k.pub"));

  expect({"sign", "k", "-i", "m", "-o", "d", "--signature", "s", "--fingerprint", "5"}, DONE, "");
  openssl("dgst -sha256 -verify k.pub -signature s d");
  const std::string text = box.run({"soter", "verify", "d", "s", "--key", "k.pub"}).out;
  EXPECT_TRUE(text.starts_with(
      R"({"raw":"pay\/10\u0001","fid":5,"counter":2,"uid":7,"tee_n":"Keymaster","tee_v":")"))
      << text;
  EXPECT_TRUE(text.ends_with("\"fp_n\":\"sensor\",\"fp_v\":\"2\",\"cpu_id\":\"cpu\"}\n")) << text;

  expect({"soter", "verify", "d", "s", "--key", "attk.pub"}, REFUSED, "(-30)");
  expect({"soter", "verify", "d", "s", "--key", "k.pub", "--digest", "sha512"}, REFUSED, "(-30)");
  std::string shorter = box.read("d");
  shorter.pop_back();
  box.write("text", shorter);
  expect({"soter", "verify", "text", "s", "--key", "k.pub"}, REFUSED, "zero byte");

  box.write("m", std::string(100'000, '/'));  // escaped, twice as long
  const json again = json::parse(
      std::string(run_json({"sign", "k", "-i", "m", "--padding", "pkcs1-sign"})["document"]));
  EXPECT_EQ(again["counter"], 3);
  EXPECT_FALSE(again.contains("fid"));
  box.write("m", std::string("a\0b", 3));
  expect({"sign", "k", "-i", "m"}, REFUSED, "UTF-8 text without zero bytes");

  expect({"generate", "rsa", "-o", "signer", "--padding", "pkcs1-sign"}, DONE, "");
  expect({"export", "signer", "-o", "signer.pub"}, DONE, "");
  generated("other", {"--export-sign", "key=signer"});
  expect({"soter", "export", "other", "-o", "o"}, DONE, "");
  expect({"soter", "verify", "o", "o.sig", "--key", "signer.pub"}, DONE, "{\"pub_key\":");
  generated("mute", {"--export-sign", "none"});
  expect({"soter", "export", "mute"}, REFUSED, "--export-sign");
}

TEST_F(KmtoolSoter, WrongUsageExitsWithTwo) {
  openssl("genpkey -algorithm RSA -pkeyopt rsa_keygen_bits:1024 -out small");
  expect({"generate", "hmac", "-o", "h"}, DONE, "");
  expect({"generate", "rsa", "--soter", "-o", "k"}, DONE, "");
  const struct {
    words arguments;
    const char* message;
  } rows[] = {
      {{"--device", "x", "device", "create", "--attk", "small"}, "2048 bits"},
      {{"--device", "x", "device", "create", "--attk", "m"}, "no RSA private key"},
      {{"--device", "x", "device", "create", "--cpu-id", std::string(65, 'c')}, "1 to 64"},
      {{"--device", "x", "device", "create", "--fp-name", ""}, "1 to 128"},
      {{"soter"}, "no verb"},
      {{"generate", "ec", "--soter", "-o", "x"}, "only RSA"},
      {{"generate", "rsa", "--uid", "7", "-o", "x"}, "--soter"},
      {{"generate", "rsa", "--soter", "--export-sign", "me", "-o", "x"}, "key=FILE"},
      {{"generate", "rsa", "--soter", "--export-sign", "key=nowhere", "-o", "x"}, "nowhere"},
      {{"sign", "h", "-i", "m", "--fingerprint", "1"}, "no SOTER key"},
      {{"sign", "k", "-i", "m", "-o", "-"}, "--signature"},
      {{"sign", "k", "-i", "m", "--signature", "s"}, "-o"},
      {{"--json", "soter", "export", "k", "-o", "-", "--signature", "s"}, "standard output"},
      {{"soter", "export", "h"}, "no SOTER key"},
      {{"export", "k"}, "kmtool soter export"},
      {{"soter", "verify", "m", "m", "--key", "m"}, "no RSA public key"},
      {{"soter", "verify", "m", "m", "--key", "attk.pub", "--digest", "none"}, "--digest"},
  };
  const words before = box.files();
  for (const auto& row : rows)
    expect(row.arguments, WRONG_USAGE, row.message);
  EXPECT_EQ(box.files(), before);
}

}  // namespace
