// The command line as its users meet it: exit codes, messages, files and JSON of the built program.
#include <unistd.h>

#include "run.h"
#include "tee/device/device.h"

namespace {

// A sandbox with a device (OS version 130000), and in it: k, an HMAC key of known bytes; m, a
// message.
class Kmtool : public sandbox {
 protected:
  Kmtool() {
    expect_done({"device", "create", "--os-version", "130000"});
    std::string key;
    for (char byte = 0; byte < 32; ++byte)
      key += byte;
    write("raw", key);
    write("m", "message");
    expect_done({"import", "hmac", "raw", "-o", "k"});
  }
};

// printf message | openssl mac -digest SHA256 -macopt hexkey:000102...1f HMAC
constexpr char MESSAGE_MAC[] = "6297b77508a1a30ea4dfadd8f847c31b49aba45de10a79daf721d3f7ec112a24";
// The same of no bytes, and of 1000000 times 'a'.
constexpr char EMPTY_MAC[] = "d38b42096d80f45f826b44a9d5607de72496a415d3f4a1a8c88e3bb9da8dc1cb";
constexpr char MILLION_MAC[] = "e54a8adae4f9c784e86041bc64fbf511adaf7f5cefe17d053720dca6aa2358ab";

TEST_F(Kmtool, SignsWhatOthersRecompute) {
  EXPECT_EQ(out_of({"sign", "k", "-i", "m"}), std::string(MESSAGE_MAC) + "\n");
  EXPECT_EQ(out_of({"sign", "k"}, "message"), std::string(MESSAGE_MAC) + "\n");
  EXPECT_EQ(out_of({"sign", "k"}), std::string(EMPTY_MAC) + "\n");
  EXPECT_EQ(out_of({"sign", "k"}, std::string(1'000'000, 'a')), std::string(MILLION_MAC) + "\n");
  EXPECT_EQ(run_json({"sign", "k", "-i", "m", "--mac", "128"})["signature"],
            std::string(MESSAGE_MAC).substr(0, 32));

  EXPECT_EQ(out_of({"sign", "k", "-i", "m", "-o", "-"}).size(), 32u);
  expect_done({"sign", "k", "-i", "m", "-o", "s"});
  EXPECT_EQ(read("s"), out_of({"sign", "k", "-i", "m", "-o", "-"}));

  std::filesystem::create_symlink("later", path("link"));
  expect_done({"sign", "k", "-i", "m", "-o", "link"});
  EXPECT_EQ(read("later").size(), 32u);
  EXPECT_TRUE(std::filesystem::is_symlink(path("link")));
}

TEST_F(Kmtool, WrongUsageAndUnreadableInputExitWithTwoAndWriteNothing) {
  const std::vector<failing_call> calls = {
      {{}, "no verb"},
      {{"nonsense"}, "nonsense"},
      {{"genrate", "hmac", "-o", "x"}, "Did you mean 'generate'?"},
      {{"device", "shwo"}, "Did you mean 'show'?"},
      {{"generate", "hmac", "-o", "x", "--param", "key_sise=8"}, "Did you mean 'key_size'?"},
      {{"device", "create"}, "exists"},
      {{"device", "create", "--id", "not-a-uuid"}, "not a UUID"},
      {{"device", "set", "--os-version", "4294967296"}, "not a number"},
      {{"--device", "nowhere", "show", "k"}, "kmtool device create"},
      {{"--trace", "9", "show", "k"}, "--trace"},
      {{"generate", "hmac"}, "--output"},
      {{"generate", "des", "-o", "x"}, "rsa ec aes hmac"},
      {{"generate", "hmac", "-o", "x", "--size", "-8"}, "not a number"},
      {{"generate", "hmac", "-o", "x", "--digest", "sha256,sha999"}, "'sha999' is none of"},
      {{"generate", "hmac", "-o", "x", "--app-id", ""}, "--app-id"},
      {{"generate", "hmac", "-o", "x", "--user-id", "7"}, "--auth-type"},
      {{"generate", "hmac", "-o", "x", "--param", "KEY_SIZE"}, "TAG=VALUE"},
      {{"generate", "hmac", "-o", "x", "--param", "NO_SUCH=1"}, "NO_SUCH"},
      {{"generate", "hmac", "-o", "x", "--param", "KEY_SIZE=4294967296"}, "too large"},
      {{"generate", "hmac", "-o", "x", "--param", "APPLICATION_ID=hex:0"}, "odd number"},
      {{"generate", "hmac", "-o", "x", "--param", "ACTIVE_DATETIME=soon"}, "no value"},
      {{"generate", "hmac", "-o", "no/folder/x"}, "no/folder/x"},
      {{"generate", "hmac", "-o", "k"}, "--force"},
      {{"--json", "generate", "hmac", "-o", "-"}, "standard output"},
      {{"show", "nowhere"}, "nowhere"},
      {{"show", "."}, "directory"},
      {{"sign", "k", "-i", "m", "--authenticate", "me"}, "USER_ID"},
      {{"sign", "k", "-i", "m", "-o", "device"}, "folder"},
      {{"sign", "k", "-i", "m", "-o", "/dev/full"}, "No space"},
      {{"token", "-o", "t"}, "--user-id"},
  };
  expect_all(WRONG_USAGE, calls);
}

TEST_F(Kmtool, RefusalsExitWithOneAndNameTheError) {
  expect_done({"generate", "hmac", "-o", "b", "--app-id", "bank"});
  const std::vector<failing_call> calls = {
      {{"generate", "hmac", "-o", "x", "--size", "1032"}, "KM_ERROR_UNSUPPORTED_KEY_SIZE (-6)"},
      {{"generate", "hmac", "-o", "x", "--param", "ORIGIN=imported"}, "(-38)"},
      {{"import", "hmac", "raw", "-o", "x", "--size", "128"}, "(-44)"},
      {{"show", "b"}, "KM_ERROR_INVALID_KEY_BLOB (-33)\nGive the application id"},
      {{"show", "b", "--app-id", "game"}, "(-33)"},
      {{"show", "m"}, "m is no key of this device"},
      {{"upgrade", "m", "-o", "x"}, "m is no key of this device"},
      {{"sign", "k", "-i", "m", "--mac", "64"}, "KM_ERROR_INVALID_MAC_LENGTH (-57)"},
      {{"sign", "k", "-i", "m", "--digest", "sha1"}, "KM_ERROR_INCOMPATIBLE_DIGEST (-13)"},
      {{"upgrade", "b", "-o", "x"}, "(-33)"},
      {{"delete", "m"}, "holds no key of this device"},
  };
  expect_all(REFUSED, calls);

  json error = run_json({"show", "b"})["error"];
  EXPECT_EQ(error["exit_code"], REFUSED);
  EXPECT_EQ(error["keymaster_error"]["number"], -33);
}

TEST_F(Kmtool, EveryAlgorithmsKeysServe) {
  for (const char* algorithm : {"rsa", "ec"}) {
    expect_done({"generate", algorithm, "-o", "a", "--force"});
    EXPECT_TRUE(out_of({"export", "a"}).starts_with("-----BEGIN PUBLIC KEY-----"));
    expect_done({"sign", "a", "-i", "m", "-o", "s"});
    expect_done({"verify", "a", "-i", "m", "--signature", "s"});
    expect({"verify", "a", "-i", "raw", "--signature", "s"}, REFUSED, "(-30)");
  }
  for (const char* algorithm : {"rsa", "aes"}) {
    expect_done({"generate", algorithm, "-o", "a", "--force", "--purpose", "encrypt,decrypt"});
    const std::string sealed = out_of({"encrypt", "a", "-i", "m"});
    EXPECT_EQ(sealed.find("message"), std::string::npos);
    EXPECT_EQ(out_of({"decrypt", "a"}, sealed), "message") << algorithm;
    EXPECT_EQ(run({"decrypt", "a"}, sealed.substr(0, sealed.size() - 1)).exit_code, REFUSED);
  }
  expect({"export", "k"}, REFUSED, "(-17)");
  expect({"import", "rsa", "m", "-o", "x"}, WRONG_USAGE, "m");
}

// Files that anyone may have made.
TEST_F(Kmtool, AttestsAndInspects) {
  expect_done({"generate", "ec", "-o", "e", "--app-id", "bank"});
  expect_done({"attest", "e", "--challenge", "C0ffee", "-o", "chain"});
  json chain = run_json({"inspect", "chain"})["certificates"];
  ASSERT_EQ(chain.size(), 2u);
  EXPECT_EQ(chain[0]["signed_by_next"], true);
  json description = chain[0]["key_description"];
  EXPECT_EQ(description["challenge"], "c0ffee");
  EXPECT_EQ(description["tee_enforced"]["algorithm"], "ec");
  EXPECT_EQ(description["tee_enforced"]["root_of_trust"]["device_locked"], true);
  EXPECT_EQ(description["software_enforced"], json::object());

  const std::string good = read("chain");
  const size_t second = good.find("-----BEGIN", 1);
  std::string forged = good.substr(0, second) + good.substr(0, second);
  EXPECT_EQ(run_json({"inspect", "-"}, forged)["certificates"][0]["signed_by_next"], false);
  const std::pair<std::string, const char*> cases[] = {
      {"", "bad is empty"},
      {"message", "the file is not a certificate"},
      {good.substr(0, 300), "the file is not a certificate"},
      {good.substr(0, second + 300), "certificate 2 of the file is damaged"},
      {std::string("\x30\x80\0\0", 4), "the file is not a certificate"},
      {std::string(5'000'000, 'a'), "bad is longer than"},
  };
  for (const auto& [file, message] : cases) {
    write("bad", file);
    expect({"inspect", "bad"}, WRONG_USAGE, message);
  }
  expect({"attest", "e", "--challenge", "c0f"}, WRONG_USAGE, "cannot read the challenge");
  expect({"attest", "e"}, WRONG_USAGE, "--challenge");
  expect({"attest", "k", "--challenge", "00"}, REFUSED, "(-4)");
}

TEST_F(Kmtool, TeeFailuresExitWithThree) {
  {
    auto holder = tee::device::open(path("device"));
    std::string us = "process " + std::to_string(getpid());
    expect({"show", "k"}, TEE_FAILED, us);
    expect({"device", "reboot"}, TEE_FAILED, us);
    expect({"token", "--user-id", "7", "-o", "t"}, TEE_FAILED, us);
  }
  expect_done({"show", "k"});
  write("device/device.json", "{");
  expect({"show", "k"}, TEE_FAILED, "device.json");
}

TEST_F(Kmtool, DescribesKeys) {
  const std::pair<words, const char*> cases[] = {
      {{},
       R"({"key_size": 256, "digest": ["sha256"], "min_mac_length": 128,
           "purpose": ["sign", "verify"], "no_auth_required": true})"},
      {{"--size", "512", "--digest", "SHA-512", "--min-mac", "64", "--purpose", "sign"},
       R"({"key_size": 512, "digest": ["sha512"], "min_mac_length": 64, "purpose": ["sign"]})"},
      {{"--user-id", "0x10", "--auth-type", "password,fingerprint", "--auth-timeout", "30"},
       R"({"user_secure_id": [16], "user_auth_type": "password,fingerprint", "auth_timeout": 30,
           "no_auth_required": null})"},
      {{"--param", "min_mac_length=72", "--param", "USAGE_EXPIRE_DATETIME=2031-02-03"},
       R"({"min_mac_length": 72, "usage_expire_datetime": "2031-02-03T00:00:00.000Z"})"},
  };
  for (const auto& [options, expected] : cases) {
    expect_done({"generate", "hmac", "-o", "x", "--force"}, options);
    json found = run_json({"show", "x"})["characteristics"];
    const json wanted = json::parse(expected);
    for (const auto& [name, value] : wanted.items())
      EXPECT_EQ(found[name], value) << name;
  }
  using std::filesystem::perms;
  EXPECT_EQ(std::filesystem::status(path("x")).permissions(),
            perms::owner_read | perms::owner_write);
}

TEST_F(Kmtool, UpgradesAndDeletes) {
  expect_done({"device", "set", "--os-version", "140000"});
  expect({"sign", "k", "-i", "m"}, REFUSED, "(-62)");
  expect_done({"upgrade", "k", "-o", "k"});
  EXPECT_EQ(out_of({"sign", "k", "-i", "m"}), std::string(MESSAGE_MAC) + "\n");
  EXPECT_EQ(run_json({"show", "k"})["characteristics"]["os_version"], 140000);

  // Outdated keys can go; what is no key goes only by force.
  expect_done({"device", "set", "--os-version", "150000"});
  expect_done({"delete", "k"});
  expect({"delete", "m"}, REFUSED, "--force");
  EXPECT_EQ(files(), (words{"m", "raw"}));
}

TEST_F(Kmtool, ServesKeysThatWantTheirUser) {
  const words generate = {"generate",  "hmac", "-o",          "u",          "--force",
                          "--user-id", "7",    "--auth-type", "fingerprint"};
  expect_done({"token", "--user-id", "7", "--type", "fingerprint", "-o", "t"});
  EXPECT_EQ(read("t").size(), 69u);

  expect_done(generate);  // each operation wants its own token
  expect({"sign", "u", "-i", "m"}, REFUSED, "(-26)");
  expect({"sign", "u", "-i", "m", "--token", "t"}, REFUSED, "--authenticate");
  expect({"sign", "u", "-i", "m", "--authenticate", "7"}, REFUSED, "authentication types");
  expect_done({"sign", "u", "-i", "m", "--authenticate", "7:fingerprint"});

  expect_done(generate, {"--auth-timeout", "60"});  // one token serves many
  expect({"sign", "u", "-i", "m"}, REFUSED, "kmtool token");
  expect_done({"sign", "u", "-i", "m", "--token", "t"});
  expect_done({"sign", "u", "-i", "m", "--authenticate", "7:fingerprint"});
  expect_done({"device", "reboot"});
  expect({"sign", "u", "-i", "m", "--token", "t"}, REFUSED, "(-38)");
}

TEST_F(Kmtool, TellsItsStory) {
  json story = run_json({"--device", path("other"), "demo"});
  EXPECT_EQ(story["sections"].size(), 12u);
  for (const char* line : {"KM_ERROR_INVALID_KEY_BLOB (-33)", "Verified OK", "2, then 3"})
    EXPECT_NE(story.dump().find(line), std::string::npos) << line;
  expect_done({"demo"});
  EXPECT_EQ(run_json({"device", "show"})["os_version"], 130000);
}

}  // namespace
