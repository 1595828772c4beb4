// The teller of the demonstration, and its device.
#include <iostream>
#include <sstream>
#include <unistd.h>

#include "demo.h"
#include "soter_factory.h"
#include "tee/device/uuid.h"

namespace kmtool {

namespace {

constexpr uint32_t FIRST_VERSION = 130000;
constexpr uint32_t FIRST_PATCHLEVEL = 202601;

}  // namespace

narrator::narrator(bool as_json)
    : as_json_(as_json), colours_(!as_json && isatty(STDOUT_FILENO) == 1) {}

void narrator::section(const std::string& title) {
  sections_.push_back({{"title", title}, {"lines", json::array()}});
  const std::string number = std::to_string(sections_.size());
  print("\n" + coloured("1;36", number + "  " + title) + "\n");
}

void narrator::show(const std::string& text) {
  std::istringstream lines(text);
  for (std::string line; std::getline(lines, line);)
    say(line);
}

void narrator::add(const std::string& plain, const std::string& shown) {
  sections_.back()["lines"].push_back(plain);
  print("   " + shown + "\n");
}

std::string narrator::coloured(const std::string& colour, const std::string& text) const {
  return colours_ ? "\033[" + colour + "m" + text + "\033[0m" : text;
}

void narrator::print(const std::string& text) const {
  if (!as_json_) std::cout << text << std::flush;
}

demo_device::demo_device(const std::string& folder) : folder_(folder) {
  try {
    original_ = tee::device::read_settings(folder_);
  } catch (const tee::device_error& error) {
    if (error.reason() != tee::device_error::kind::NOT_FOUND) throw;
    tee::device::create(folder_, {});
    provision(folder_, factory_options().data(tee::device::read_settings(folder_)));
  }
  set_version(FIRST_VERSION, FIRST_PATCHLEVEL);
}

demo_device::~demo_device() {
  stop();
  if (!original_) return;
  try {
    tee::device::write_settings(folder_, *original_);
  } catch (const tee::device_error& error) {
    std::cerr << "kmtool: the device keeps the demo's OS version: " << error.what() << "\n";
  }
}

keymaster_device* demo_device::start() {
  stop();
  return &keymaster_.emplace(folder_);
}

void demo_device::set_version(uint32_t os_version, uint32_t os_patchlevel) {
  stop();
  tee::device_settings settings = tee::device::read_settings(folder_);
  settings.os_version = os_version;
  settings.os_patchlevel = os_patchlevel;
  tee::device::write_settings(folder_, settings);
}

}  // namespace kmtool
