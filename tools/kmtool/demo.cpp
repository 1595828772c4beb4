// kmtool demo: what a Keymaster does, told in eight short steps on a real device.
#include <cstdlib>
#include <filesystem>
#include <iostream>
#include <unistd.h>

#include "client/operation.h"
#include "files.h"
#include "keymaster_device.h"
#include "listing.h"
#include "tee/device/uuid.h"
#include "tool.h"

namespace kmtool {

using namespace keymaster;
using client::param_set;

namespace {

constexpr uint32_t OLD_VERSION = 130000;
constexpr uint32_t NEW_VERSION = 140000;
constexpr uint32_t OLD_PATCHLEVEL = 202601;
constexpr uint32_t NEW_PATCHLEVEL = 202607;
constexpr char KNOWN_KEY[] = "000102030405060708090a0b0c0d0e0f101112131415161718191a1b1c1d1e1f";
constexpr char OWN_TEXT[] = "Keys that never leave their device";

// Tells the story: on the terminal as it happens, or as one JSON object at its end.
class narrator {
 public:
  explicit narrator(bool as_json)
      : as_json_(as_json), colours_(!as_json && isatty(STDOUT_FILENO) == 1) {}

  void section(const std::string& title) {
    sections_.push_back({{"title", title}, {"lines", json::array()}});
    std::string number = std::to_string(sections_.size());
    print("\n" + coloured("1;36", number + "  " + title) + "\n");
  }
  void say(const std::string& line) { add(line, line); }
  void show(const table& lines) {
    for (std::istringstream in(lines.text("")); in.good();) {
      std::string line;
      if (std::getline(in, line)) add(line, line);
    }
  }
  void good(const std::string& line) { add(line, coloured("32", line)); }
  void refused(const client::status& outcome) {
    add(outcome.text(), coloured("33", outcome.text()));
  }
  const json& sections() const { return sections_; }

 private:
  void add(const std::string& plain, const std::string& shown) {
    sections_.back()["lines"].push_back(plain);
    print("   " + shown + "\n");
  }
  std::string coloured(const std::string& colour, const std::string& text) const {
    return colours_ ? "\033[" + colour + "m" + text + "\033[0m" : text;
  }
  void print(const std::string& text) const {
    if (!as_json_) std::cout << text << std::flush;
  }

  bool as_json_;
  bool colours_;
  json sections_ = json::array();
};

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

// The device of the demonstration. One that was there already gets its settings back at the end.
class demo_device {
 public:
  explicit demo_device(const std::string& folder) : folder_(folder) {
    try {
      original_ = tee::device::read_settings(folder_);
    } catch (const tee::device_error& error) {
      if (error.reason() != tee::device_error::kind::NOT_FOUND) throw;
      tee::device_settings fresh;
      fresh.id = tee::new_uuid();
      tee::device::create(folder_, fresh);
    }
    set_version(OLD_VERSION, OLD_PATCHLEVEL);
  }
  demo_device(const demo_device&) = delete;
  demo_device& operator=(const demo_device&) = delete;
  ~demo_device() {
    keymaster_.reset();
    if (!original_) return;
    try {
      tee::device::write_settings(folder_, *original_);
    } catch (const tee::device_error& error) {
      std::cerr << "kmtool: the device keeps the demo's OS version: " << error.what() << "\n";
    }
  }

  // start: a fresh instance of the trusted application.
  client::session* start() {
    keymaster_.reset();
    return keymaster_.emplace(folder_).session();
  }
  client::session* session() { return keymaster_->session(); }

  void set_version(uint32_t os_version, uint32_t os_patchlevel) {
    keymaster_.reset();
    tee::device_settings settings = tee::device::read_settings(folder_);
    settings.os_version = os_version;
    settings.os_patchlevel = os_patchlevel;
    tee::device::write_settings(folder_, settings);
  }

 private:
  std::string folder_;
  std::optional<tee::device_settings> original_;
  std::optional<keymaster_device> keymaster_;
};

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
  story->show(list_params(imported.characteristics));
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
  story->refused(outcome);
  story->say("and by 'bank':");
  require(device->session()->get_key_characteristics(blob, owner), "cannot open the key");
  story->good("opened");
}

void show_upgrade(narrator* story, demo_device* device, const sample& text, bytes* blob) {
  story->section("A system update");
  std::string before = mac_of(device->session(), *blob, text.content);
  device->set_version(NEW_VERSION, NEW_PATCHLEVEL);
  client::session* keymaster = device->start();
  story->say("The system goes from " + std::to_string(OLD_VERSION) + " to " +
             std::to_string(NEW_VERSION) + "; the first key is now refused:");
  story->refused(keymaster->get_key_characteristics(*blob));
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
  client::session* keymaster = device->start();
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
  story.say("identity  " + tee::to_text(settings.id));
  story.say("system    OS version " + std::to_string(settings.os_version) + ", patch level " +
            std::to_string(settings.os_patchlevel));

  bytes blob;
  show_generated_key(&story, &device, text, &blob);
  show_known_key(&story, &device, text);
  show_refusal(&story, &device);
  show_upgrade(&story, &device, text, &blob);
  show_restart(&story, &device, text, blob);
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
