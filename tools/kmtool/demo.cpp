// kmtool demo: what a Keymaster does, told in short steps on a real device.
#include "demo.h"

#include <cstdlib>
#include <filesystem>
#include <unistd.h>

#include "files.h"
#include "keymaster/client/operation.h"
#include "listing.h"
#include "tee/device/uuid.h"

namespace kmtool {

using namespace keymaster;
using client::param_set;

namespace {

constexpr uint32_t NEW_VERSION = 140000;
constexpr uint32_t NEW_PATCHLEVEL = 202607;
constexpr char KNOWN_KEY[] = "000102030405060708090a0b0c0d0e0f101112131415161718191a1b1c1d1e1f";
constexpr char OWN_TEXT[] = "Keys that never leave their device";

class temporary_folder {
 public:
  temporary_folder() {
    path_ = (std::filesystem::temp_directory_path() / "kmtool-demo.XXXXXX").string();
    if (!mkdtemp(path_.data())) throw failure(WRONG_USAGE, "cannot make the folder " + path_);
  }
  temporary_folder(const temporary_folder&) = delete;
  temporary_folder& operator=(const temporary_folder&) = delete;
  ~temporary_folder() {
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
  }
  const std::string& path() const { return path_; }

 private:
  std::string path_;
};

// What the demonstration signs, and how a shell hands it to openssl.
struct sample {
  std::string name;
  bytes content;
  std::string before;  // goes in front of the command
  std::string input;   // its input option
};

sample find_sample() try {
  return {"README.md", read_file("README.md"), "", "-in README.md "};
} catch (const failure&) {
  return {"a text", client::copy_of(client::as_bytes(OWN_TEXT)),
          "printf '" + std::string(OWN_TEXT) + "' | ", ""};
}

param_set hmac_description() {
  param_set description;
  description.add(KM_TAG_ALGORITHM, KM_ALGORITHM_HMAC).add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256);
  description.add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN).add(KM_TAG_MIN_MAC_LENGTH, 128);
  description.add_flag(KM_TAG_NO_AUTH_REQUIRED);
  return description;
}

std::string mac_of(client::session* keymaster, client::byte_view blob, client::byte_view data) {
  param_set params;
  params.add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256).add(KM_TAG_MAC_LENGTH, 256);
  auto begun = keymaster->begin(KM_PURPOSE_SIGN, blob, params);
  require(begun, "cannot sign");
  client::operation signing(keymaster, begun);
  bytes unused;
  require(signing.update(data, &unused), "cannot sign");
  auto end = signing.finish();
  require(end, "cannot sign");
  return client::to_hex(end.output);
}

client::bytes generate(client::session* keymaster, const param_set& description) {
  auto made = keymaster->generate_key(description);
  require(made, "cannot generate a key");
  return made.blob;
}

void show_generated_key(narrator* story, demo_device* device, const sample& text, bytes* blob) {
  story->section("A key");
  *blob = generate(device->session(), hmac_description().add(KM_TAG_KEY_SIZE, 256));
  story->say("A 256-bit HMAC key, sealed by the device: " + std::to_string(blob->size()) +
             " bytes that only this device opens.");
  story->say(client::to_hex(client::byte_view(*blob).first(32)) + "...");

  story->section("A signature");
  story->say("HMAC-SHA256 of " + text.name + " (" + std::to_string(text.content.size()) +
             " bytes):");
  story->good(mac_of(device->session(), *blob, text.content));
}

void show_known_key(narrator* story, demo_device* device, const sample& text) {
  story->section("The same by other means");
  auto imported = device->session()->import_key(hmac_description(), client::from_hex(KNOWN_KEY));
  require(imported, "cannot import a key");
  story->say("A key of known bytes, imported, gives");
  story->good(mac_of(device->session(), imported.blob, text.content));
  story->say("and so does");
  story->say("  " + text.before + "openssl mac -digest SHA256 " + text.input + "\\");
  story->say("    -macopt hexkey:" + std::string(KNOWN_KEY) + " HMAC");

  story->section("What the key may do");
  story->show(list_params(imported.characteristics).text(""));
}

void show_refusal(narrator* story, demo_device* device) {
  story->section("A refusal");
  const client::application owner = {{'b', 'a', 'n', 'k'}, {}};
  const client::application stranger = {{'g', 'a', 'm', 'e'}, {}};
  param_set description = hmac_description().add(KM_TAG_KEY_SIZE, 256);
  owner.bind(&description);
  bytes blob = generate(device->session(), description);
  story->say("A key bound to the application 'bank', asked for by 'game':");
  client::status outcome = device->session()->get_key_characteristics(blob, stranger);
  story->refused(outcome.text());
  story->say("and by 'bank':");
  require(device->session()->get_key_characteristics(blob, owner), "cannot open the key");
  story->good("opened");
}

void show_upgrade(narrator* story, demo_device* device, const sample& text, bytes* blob) {
  story->section("A system update");
  std::string before = mac_of(device->session(), *blob, text.content);
  const uint32_t old_version = tee::device::read_settings(device->folder()).os_version;
  device->set_version(NEW_VERSION, NEW_PATCHLEVEL);
  client::session* keymaster = device->start()->session();
  story->say("The system goes from " + std::to_string(old_version) + " to " +
             std::to_string(NEW_VERSION) + "; the first key is now refused:");
  story->refused(keymaster->get_key_characteristics(*blob).text());
  auto upgraded = keymaster->upgrade_key(*blob);
  require(upgraded, "cannot upgrade the key");
  *blob = upgraded.blob;
  bool same = mac_of(keymaster, *blob, text.content) == before;
  if (!same) throw failure(TEE_FAILED, "the upgraded key gives another MAC");
  story->good("Upgraded: it opens again and gives the same MAC.");
}

void show_restart(narrator* story, demo_device* device, const sample& text, const bytes& blob) {
  story->section("A restart");
  std::string before = mac_of(device->session(), blob, text.content);
  client::session* keymaster = device->start()->session();
  if (mac_of(keymaster, blob, text.content) != before) {
    throw failure(TEE_FAILED, "after a restart the key gives another MAC");
  }
  story->say("The trusted application ended and started anew; it kept no key.");
  story->good("The blob opens and gives the same MAC.");
}

verb_result demonstrate(const command_line& line) {
  // The refusals are part of the story; their trace lines are not, unless asked for.
  setenv("TEE_TRACE_LEVEL", "0", 0);
  narrator story(line.as_json);
  temporary_folder scratch;
  std::string folder = line.device.empty() ? scratch.path() + "/device" : line.device;
  sample text = find_sample();

  story.section("A device");
  demo_device device(folder);
  device.start();
  tee::device_settings settings = tee::device::read_settings(folder);
  story.say("identity  " + tee::to_text(settings.public_id));
  story.say("system    OS version " + std::to_string(settings.os_version) + ", patch level " +
            std::to_string(settings.os_patchlevel));

  bytes blob;
  show_generated_key(&story, &device, text, &blob);
  show_known_key(&story, &device, text);
  show_refusal(&story, &device);
  show_upgrade(&story, &device, text, &blob);
  show_restart(&story, &device, text, blob);
  show_soter(&story, &device, scratch.path());
  verb_result result;
  result.object = {{"sections", story.sections()}};
  return result;
}

}  // namespace

void add_demo_verb(CLI::App* app, command_line* line) {
  CLI::App* verb = app->add_subcommand(
      "demo", "Show what a Keymaster does, on a temporary device unless --device names one");
  verb->callback([=] { line->action = [=] { return demonstrate(*line); }; });
}

}  // namespace kmtool
