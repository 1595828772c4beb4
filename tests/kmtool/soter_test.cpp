// SOTER on the command line: provisioning, the ATTK, and documents that openssl verifies.
#include "run.h"
#include "tee/device/device.h"
#include "tee/device/uuid.h"

namespace {

// A sandbox with a device whose ATTK lies in attk (private) and attk.pub (public).
class KmtoolSoter : public sandbox {
 protected:
  KmtoolSoter() {
    openssl("genpkey -algorithm RSA -pkeyopt rsa_keygen_bits:2048 -out attk");
    openssl("pkey -in attk -pubout -out attk.pub");
    write("m", "pay/10\x01");
    expect_done({"device", "create", "--attk", "attk", "--fp-name", "sensor", "--fp-version", "2",
                 "--cpu-id", "cpu", "--device-id", "serial 1"});
  }
  void openssl(const std::string& arguments) {
    EXPECT_EQ(shell("openssl " + arguments + " >.openssl 2>&1"), 0)
        << arguments << read(".openssl");
  }
};

TEST_F(KmtoolSoter, DevicesAreProvisionedOnce) {
  expect({"soter", "check-attk"}, DONE, "ready");
  EXPECT_EQ(out_of({"soter", "export-attk"}), read("attk.pub"));
  EXPECT_EQ(out_of({"soter", "device-id"}), "serial 1\n");
  expect({"soter", "fingerprint", "3"}, DONE, "took the report");
  expect({"device", "provision"}, REFUSED, "provisioned before");

  tee::device_settings settings;
  settings.identity = tee::new_uuid();
  tee::device::create(path("bare"), settings);
  expect({"--device", "bare", "soter", "check-attk"}, REFUSED, "no ATTK (-1)");
  expect({"--device", "bare", "soter", "export-attk"}, REFUSED, "kmtool device provision");
  expect({"--device", "bare", "soter", "device-id"}, REFUSED, "(-1000)");
  expect_done({"--device", "bare", "device", "provision"});
  EXPECT_EQ(run_json({"--device", "bare", "soter", "device-id"})["device_id"],
            tee::to_text(tee::public_id_of(settings.identity)));
}

TEST_F(KmtoolSoter, DocumentsAreSplitAndVerified) {
  const words generate = {"generate", "rsa", "--soter", "--padding", "pkcs1-sign"};
  expect_done(generate, {"-o", "k", "--uid", "7", "--counter"});
  expect({"soter", "export", "k", "-o", "e", "--public-key", "k.pub"}, DONE, "e.sig");
  openssl("dgst -sha256 -verify attk.pub -signature e.sig e");
  expect({"soter", "verify", "e", "e.sig", "--key", "attk.pub"}, DONE, "\"counter\":1,\"uid\":7");
  EXPECT_EQ(std::string(json::parse(read("e").c_str())["pub_key"]) + "\n", read("k.pub"));

  expect_done({"sign", "k", "-i", "m", "-o", "d", "--signature", "s", "--fingerprint", "5"});
  openssl("dgst -sha256 -verify k.pub -signature s d");
  const std::string text = out_of({"soter", "verify", "d", "s", "--key", "k.pub"});
  EXPECT_TRUE(text.starts_with(
      R"({"raw":"pay\/10\u0001","fid":5,"counter":2,"uid":7,"tee_n":"Keymaster","tee_v":")"))
      << text;
  EXPECT_TRUE(text.ends_with("\"fp_n\":\"sensor\",\"fp_v\":\"2\",\"cpu_id\":\"cpu\"}\n")) << text;

  expect({"soter", "verify", "d", "s", "--key", "attk.pub"}, REFUSED, "(-30)");
  expect({"soter", "verify", "d", "s", "--key", "k.pub", "--digest", "sha512"}, REFUSED, "(-30)");
  write("text", read("d").c_str());
  expect({"soter", "verify", "text", "s", "--key", "k.pub"}, REFUSED, "zero byte");

  write("m", std::string(100'000, '/'));  // escaped, twice as long
  const json again = json::parse(
      std::string(run_json({"sign", "k", "-i", "m", "--padding", "pkcs1-sign"})["document"]));
  EXPECT_EQ(again["counter"], 3);
  EXPECT_FALSE(again.contains("fid"));
  write("m", std::string("a\0b", 3));
  expect({"sign", "k", "-i", "m"}, REFUSED, "UTF-8 text without zero bytes");

  expect_done({"generate", "rsa", "-o", "signer", "--padding", "pkcs1-sign"});
  expect_done({"export", "signer", "-o", "signer.pub"});
  expect_done(generate, {"-o", "other", "--export-sign", "key=signer"});
  expect_done({"soter", "export", "other", "-o", "o"});
  expect({"soter", "verify", "o", "o.sig", "--key", "signer.pub"}, DONE, "{\"pub_key\":");
  expect_done(generate, {"-o", "mute", "--export-sign", "none"});
  expect({"soter", "export", "mute"}, REFUSED, "--export-sign");
}

TEST_F(KmtoolSoter, WrongUsageExitsWithTwo) {
  openssl("genpkey -algorithm RSA -pkeyopt rsa_keygen_bits:1024 -out small");
  expect_done({"generate", "hmac", "-o", "h"});
  expect_done({"generate", "rsa", "--soter", "-o", "k"});
  const std::vector<failing_call> calls = {
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
  expect_all(WRONG_USAGE, calls);
}

}  // namespace
