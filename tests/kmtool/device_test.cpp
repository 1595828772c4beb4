// What a device tells of itself, what an outsider can make of that, and a folder of the earlier
// form.
#include <algorithm>
#include <cstring>
#include <filesystem>
#include <set>

#include "run.h"
#include "support/blob_forge.h"
#include "tee/device/uuid.h"

namespace {

namespace fs = std::filesystem;
namespace test = keymaster::test;

using keymaster::client::bytes;

class KmtoolDevice : public sandbox {
 protected:
  void openssl(const std::string& arguments) {
    ASSERT_EQ(shell("openssl " + arguments + " >.openssl 2>&1"), 0) << read(".openssl");
  }
  // Everything that the device says to anyone who asks.
  std::string all_that_is_told() {
    write("m", "message");
    expect_done({"generate", "rsa", "--soter", "--counter", "--padding", "pkcs1-sign", "-o", "s"});
    expect_done({"sign", "s", "-i", "m", "-o", "d", "--signature", "d.sig"});
    expect_done({"soter", "export", "s", "-o", "e"});
    expect_done({"generate", "ec", "-o", "told"});
    expect_done({"attest", "told", "--challenge", "00", "-o", "chain"});
    return read("d") + read("e") + out_of({"inspect", "chain"}) + out_of({"soter", "device-id"}) +
           out_of({"device", "show"}) + out_of({"--json", "device", "show"});
  }
};

// Whatever begins with 32 hexadecimal digits, hyphens aside, as identities.
std::set<std::string> identities_in(const std::string& text) {
  std::set<std::string> found;
  for (std::string digits; char c : text + " ") {
    if (c == '-') continue;
    if (isxdigit(static_cast<unsigned char>(c)) != 0) {
      digits += c;
      continue;
    }
    for (size_t hyphen : {8, 13, 18, 23})
      if (digits.size() > hyphen) digits.insert(hyphen, 1, '-');
    TEE_UUID id{};
    if (tee::parse_uuid(digits.substr(0, 36), &id)) found.insert(tee::to_text(id));
    digits.clear();
  }
  return found;
}

// The key storage key that a device of that identity derives.
bytes derived_ksk(const std::string& identity) {
  TEE_UUID id{};
  EXPECT_TRUE(tee::parse_uuid(identity, &id));
  bytes ksk(32, 0x4B);
  memcpy(ksk.data(), &id, sizeof(id));
  return ksk;
}

// The plaintext of an imported key's blob, its origin changed to "generated".
bytes as_generated(bytes plaintext) {
  const bytes origin = {0xBE, 0x02, 0x00, 0x10};
  const auto found = std::search(plaintext.begin(), plaintext.end(), origin.begin(), origin.end());
  EXPECT_LT(found, plaintext.end() - 8);
  EXPECT_EQ(found[8], 2);
  found[8] = 0;
  return plaintext;
}

// From what a device publishes nobody makes a key that the device takes for its own.
TEST_F(KmtoolDevice, NothingThatItTellsLetsOthersForgeItsKeys) {
  expect_done({"device", "create"});
  const auto candidates = identities_in(all_that_is_told());
  EXPECT_FALSE(candidates.empty());
  openssl("genpkey -algorithm EC -pkeyopt ec_paramgen_curve:P-256 -out outside");
  for (const std::string& identity : candidates) {
    fs::remove_all(path("twin"));
    const words twin = {"--device", "twin", "device", "create", "--no-rpmb", "--id"};
    expect_done(twin, {identity});
    expect_done({"--device", "twin", "import", "ec", "outside", "-o", "imported", "--force"});
    const std::string blob = read("imported");
    const bytes ksk = derived_ksk(identity);
    const bytes forged =
        test::seal(as_generated(test::unseal(bytes(blob.begin(), blob.end()), ksk)), ksk);
    write("forged", {forged.begin(), forged.end()});
    expect({"attest", "forged", "--challenge", "00"}, REFUSED, "(-62)");
  }
}

// The identity of a device of the earlier form stood in its settings and its documents. It does not
// any more, and the keys stay.
// Limits hold over programs until the device reboots.
TEST_F(KmtoolDevice, IsServed) {
  expect_done({"device", "create"});
  const words served = {"--device", "teed:" + path("device")};
  auto sign = [&](int exit_code, const std::string& message) {
    words call = served;
    call.insert(call.end(), {"sign", "k", "-i", "m", "-o", "mac"});
    expect(call, exit_code, message);
  };
  write("m", "message");
  expect_done(served, {"generate", "hmac", "--size", "256", "--digest", "sha256", "--min-mac",
                       "128", "--purpose", "sign", "--param", "max_uses_per_boot=2", "-o", "k"});
  EXPECT_EQ(run_json({"device", "show"})["served_by"].count("process"), 1u);
  sign(0, "");
  sign(0, "");
  sign(1, "KM_ERROR_KEY_MAX_OPS_EXCEEDED");
  expect({"device", "set", "--os-version", "1"}, 3, "is in use by process");
  expect_done({"device", "reboot"});
  EXPECT_EQ(run_json({"device", "show"}).count("served_by"), 0u);
  sign(0, "");
  EXPECT_EQ(run_json({"device", "stop"})["stopped"], true);
  EXPECT_EQ(run_json({"device", "stop"})["stopped"], false);
}

TEST_F(KmtoolDevice, OfTheEarlierFormIsBroughtOver) {
  const std::string identity = "8e6bcb0e-0d5c-4a43-9b1c-7f2b1c2d3e4f";
  fs::copy(EARLIER_DEVICE, path("device"));
  fs::rename(path("device/hmac.key"), path("hmac.key"));
  fs::permissions(path("device"), fs::perms::owner_all);
  for (const auto& file : fs::directory_iterator(path("device")))
    fs::permissions(file, fs::perms::owner_read | fs::perms::owner_write);
  const std::string shown = out_of({"device", "show"});
  write("hello", "hello");
  expect_done({"sign", "hmac.key", "-i", "hello", "-o", "mac"});
  const std::string mac = read("mac");
  EXPECT_EQ(keymaster::client::to_hex(bytes(mac.begin(), mac.end())),
            "88cb20cb6269d6f8f846d6e2d02f5fb4a6eabbd0db4125f2f1c72536cc386ab2");

  const std::string told = shown + all_that_is_told();
  EXPECT_NE(told.find("\"counter\":2"), std::string::npos);  // 1 went out under the earlier form
  EXPECT_FALSE(identities_in(told).contains(identity));
  EXPECT_EQ(shown, out_of({"device", "show"}));
  expect({"device", "provision"}, REFUSED, "provisioned before");
}

// A wrong storage.db costs nothing; giving up what it lacks is said and done on its own.
TEST_F(KmtoolDevice, IsCheckedAndRepaired) {
  expect_done({"device", "create"});
  const std::string before = read("device/storage.db");
  expect_done({"generate", "hmac", "-o", "k"});
  expect_done({"sign", "k", "-i", "k", "-o", "mac"});
  const std::string right = read("device/storage.db");
  expect({"device", "check"}, DONE, "pass their checks");

  write("device/storage.db", before);
  for (int look = 0; look < 2; look++) {
    expect({"show", "k"}, TEE_FAILED, "kmtool device check");
    const json found = run_json({"device", "check"})["damaged"];
    ASSERT_EQ(found.size(), 1U);
    EXPECT_EQ(found[0]["object"], "key storage key");
    EXPECT_EQ(found[0]["fault"], "its row is missing");
  }
  EXPECT_EQ(run({"device", "check"}).exit_code, TEE_FAILED);
  const call_result told = run({"device", "repair"});
  EXPECT_EQ(told.exit_code, REFUSED);
  EXPECT_NE(told.out.find("every key"), std::string::npos);
  write("device/storage.db", right);
  expect({"device", "repair"}, DONE, "nothing to repair");
  expect({"verify", "k", "-i", "k", "--signature", "mac"}, DONE);

  write("device/storage.db", before);
  expect({"device", "repair", "--forget"}, DONE, "every key");
  expect({"device", "check"}, DONE, "pass their checks");
  expect({"show", "k"}, REFUSED, "no key of this device");
  expect_done({"generate", "hmac", "-o", "again"});
}

TEST_F(KmtoolDevice, IsBackedUpAndRestored) {
  expect_done({"device", "create"});
  all_that_is_told();  // counter 1 and 2
  expect({"device", "backup", "b"}, DONE, "has the device's keys");
  EXPECT_EQ(fs::status(path("b")).permissions(), fs::perms(0600));
  expect({"device", "backup", "b"}, WRONG_USAGE, "exists already");
  expect_done({"generate", "hmac", "-o", "k"});
  const json third = run_json({"sign", "s", "-i", "m"});

  const std::string good = read("b");
  for (const size_t size : {size_t{0}, size_t{7}, size_t{50}, good.size() / 2, good.size() - 1}) {
    write("bad", good.substr(0, size));
    expect({"--device", "d2", "device", "restore", "bad"}, WRONG_USAGE, "bad");
    write("bad", good.substr(0, size) + char(~good[size]) + good.substr(size + 1));
    expect({"--device", "d2", "device", "restore", "bad"}, WRONG_USAGE);
  }
  write("bad", good + "x");
  expect({"--device", "d2", "device", "restore", "bad"}, WRONG_USAGE, "not authentic");
  expect({"--device", "d2", "device", "restore", "nowhere"}, WRONG_USAGE, "nowhere");
  EXPECT_FALSE(fs::exists(path("d2")));

  expect({"device", "restore", "b"}, WRONG_USAGE, "exists already");
  expect({"--device", "d2", "device", "restore", "b"}, DONE, "repeat numbers");
  expect_done({"--device", "d2", "show", "k"});
  EXPECT_EQ(run_json({"--device", "d2", "sign", "s", "-i", "m"})["document"], third["document"]);
}

}  // namespace
