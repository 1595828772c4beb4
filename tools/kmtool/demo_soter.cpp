// The demonstration's second half: the device's own key, documents, and the counter.
#include <array>
#include <cstdio>
#include <filesystem>
#include <memory>
#include <sys/wait.h>

#include "demo.h"
#include "files.h"
#include "keymaster/client/operation.h"
#include "soter_document.h"

namespace kmtool {

using namespace keymaster;
using client::param_set;

namespace {

constexpr uint32_t DEMO_UID = 1000;
constexpr uint32_t DEMO_FINGER = 7;
constexpr char PAYMENT[] = "pay 10.00 to Ann";
constexpr int NO_SUCH_PROGRAM = 127;  // what a shell answers

struct program_result {
  int exit_code;
  std::string output;
};

std::string quoted(const std::string& word) {
  std::string result = "'";
  for (const char c : word)
    result += c == '\'' ? std::string("'\\''") : std::string(1, c);
  return result + "'";
}

// Runs a program in `folder`; what it prints is the output, errors included.
program_result run_program(const std::string& folder, const std::vector<std::string>& words) {
  std::string line = "cd " + quoted(folder) + " &&";
  for (const std::string& word : words)
    line += " " + quoted(word);
  line += " 2>&1 </dev/null";
  FILE* pipe = popen(line.c_str(), "r");
  if (pipe == nullptr) throw failure(TEE_FAILED, "cannot start " + words[0]);
  program_result result{};
  std::array<char, 4096> piece{};
  while (const size_t length = fread(piece.data(), 1, piece.size(), pipe))
    result.output.append(piece.data(), length);
  const int status = pclose(pipe);
  result.exit_code = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  return result;
}

// Verifies with openssl where that is installed, and with libcrypto in any case.
void verify_with_openssl(narrator* story, const std::string& folder, const std::string& key,
                         const std::string& signature, const std::string& document) {
  const std::vector<std::string> words = {"openssl", "dgst",       "-sha256", "-verify",
                                          key,       "-signature", signature, document};
  std::string shown;
  for (const std::string& word : words)
    shown += " " + word;
  const program_result done = run_program(folder, words);
  const auto content = [&](const std::string& name) { return read_file(folder + "/" + name); };
  const bool good = verifying_padding(content(document), content(signature), KM_DIGEST_SHA_2_256,
                                      key, content(key)) == "pkcs1";
  if (!good || (done.exit_code != 0 && done.exit_code != NO_SUCH_PROGRAM)) {
    throw failure(TEE_FAILED, "the document's signature is not the ATTK's: " + done.output);
  }
  story->say(" " + shown);
  if (done.exit_code == 0) {
    story->good(done.output.substr(0, done.output.find('\n')));
  } else {
    story->good("openssl is not installed here; libcrypto says: verified");
  }
}

bytes make_soter_key(client::session* keymaster) {
  param_set description;
  description.add(KM_TAG_ALGORITHM, KM_ALGORITHM_RSA).add(KM_TAG_KEY_SIZE, 2048);
  description.add(KM_TAG_RSA_PUBLIC_EXPONENT, 65537).add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN);
  description.add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256).add(KM_TAG_PADDING, KM_PAD_RSA_PSS);
  description.add_flag(KM_TAG_NO_AUTH_REQUIRED).add_flag(KM_TAG_SOTER_KEY);
  description.add(KM_TAG_SOTER_UID, DEMO_UID).add_flag(KM_TAG_SOTER_ATTK_SIGNS);
  client::key_result made = keymaster->generate_key(description);
  require(made, "cannot generate a SOTER key");
  return std::move(made.blob);
}

client::signed_document sign_payment(client::session* keymaster, byte_view blob) {
  param_set params;
  params.add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256).add(KM_TAG_PADDING, KM_PAD_RSA_PSS);
  const auto begun = keymaster->begin(KM_PURPOSE_SIGN, blob, params);
  require(begun, "cannot sign a document");
  client::operation signing(keymaster, begun);
  bytes none;
  require(signing.update(client::as_bytes(PAYMENT), &none), "cannot sign a document");
  const auto end = signing.finish();
  require(end, "cannot sign a document");
  return client::parse_signed_document(end.output);
}

// The ATTK's public key goes to attk.pem. False when the device has none.
bool show_attk(narrator* story, client::session* keymaster, const std::string& scratch) {
  story->section("The device's own key");
  client::soter soter(keymaster);
  const client::attk_result checked = soter.check_attk();
  require(checked, "cannot check the ATTK");
  if (checked.state != client::attk_state::READY) {
    story->refused(
        "This device has no attestation key (ATTK); 'kmtool device provision' gives one.");
    return false;
  }
  client::soter_result exported = soter.export_attk();
  require(exported, "cannot export the ATTK");
  story->say("Provisioned in the factory, kept by the vault: the attestation key (ATTK).");
  story->show(std::string(exported.data.begin(), exported.data.end()));
  write_file(scratch + "/attk.pem", exported.data, access::NORMAL);
  return true;
}

// Returns the SOTER key's public key in PEM, as its document tells it.
std::string show_soter_key(narrator* story, client::session* keymaster, byte_view blob,
                           const std::string& scratch) {
  story->section("A key that signs documents");
  const client::data_result exported = keymaster->export_key(blob);
  require(exported, "cannot export the SOTER key");
  const client::signed_document document = client::parse_signed_document(exported.data);
  write_file(scratch + "/key.json", document.document, access::NORMAL);
  write_file(scratch + "/key.sig", document.signature, access::NORMAL);
  story->say("A SOTER key's public half comes out in a document that the ATTK signs:");
  story->say(escape_controls(document.text()).substr(0, 72) + "...");
  verify_with_openssl(story, scratch, "attk.pem", "key.sig", "key.json");
  return json::parse(document.text()).at("pub_key");
}

void show_payment(narrator* story, keymaster_device* keymaster, byte_view blob,
                  const std::string& public_key) {
  story->section("A finger, a message, a signature");
  report_fingerprint(*keymaster, DEMO_FINGER);
  story->say("The sensor recognises finger " + std::to_string(DEMO_FINGER) + "; the key signs '" +
             PAYMENT + "':");
  const client::signed_document made = sign_payment(keymaster->session(), blob);
  story->say(escape_controls(made.text()));
  const auto verified = [&](byte_view data) {
    return verifying_padding(data, made.signature, KM_DIGEST_SHA_2_256, "the public key",
                             client::as_bytes(public_key))
        .has_value();
  };
  const byte_view document = made.document;
  if (!verified(document) || verified(document.first(document.size() - 1))) {
    throw failure(TEE_FAILED, "the signature is not over the document and its zero byte");
  }
  story->good("The signature is good over the text and the zero byte that ends it.");
  story->say("Over the text alone it is not.");
}

uint64_t counter_of_run(const demo_device& device, const std::string& scratch) {
  const std::string program = std::filesystem::read_symlink("/proc/self/exe");
  const program_result done =
      run_program(".", {program, "--device", device.folder(), "--json", "sign",
                        scratch + "/soter.key", "-i", scratch + "/payment"});
  if (done.exit_code != 0) throw failure(TEE_FAILED, "a second kmtool failed: " + done.output);
  const std::string document = json::parse(done.output).at("document");
  return json::parse(document).at("counter");
}

void show_counter(narrator* story, demo_device* device, byte_view blob,
                  const std::string& scratch) {
  story->section("A counter that never goes back");
  write_file(scratch + "/soter.key", blob, access::PRIVATE);
  write_file(scratch + "/payment", client::as_bytes(PAYMENT), access::NORMAL);
  device->stop();
  const uint64_t first = counter_of_run(*device, scratch);
  const uint64_t second = counter_of_run(*device, scratch);
  if (second <= first) throw failure(TEE_FAILED, "the counter did not rise");
  story->say("Two more runs of this program sign again; every document has a number of its own:");
  story->good(std::to_string(first) + ", then " + std::to_string(second));
}

}  // namespace

void show_soter(narrator* story, demo_device* device, const std::string& scratch) {
  keymaster_device* keymaster = device->start();
  if (!show_attk(story, keymaster->session(), scratch)) return;
  const bytes blob = make_soter_key(keymaster->session());
  const std::string public_key = show_soter_key(story, keymaster->session(), blob, scratch);
  show_payment(story, keymaster, blob, public_key);
  show_counter(story, device, blob, scratch);
}

}  // namespace kmtool
