// What the parts of the demonstration share.
#pragma once

#include <optional>
#include <string>

#include "keymaster_device.h"
#include "listing.h"
#include "tool.h"

namespace kmtool {

// narrator: tells the story: on the terminal as it happens, or as one JSON object at its end.
class narrator {
 public:
  explicit narrator(bool as_json);

  void section(const std::string& title);
  void say(const std::string& line) { add(line, line); }
  // show: a text line by line.
  void show(const std::string& text);
  void good(const std::string& line) { add(line, coloured("32", line)); }
  void refused(const std::string& reason) { add(reason, coloured("33", reason)); }
  const json& sections() const { return sections_; }

 private:
  void add(const std::string& plain, const std::string& shown);
  std::string coloured(const std::string& colour, const std::string& text) const;
  void print(const std::string& text) const;

  bool as_json_;
  bool colours_;
  json sections_ = json::array();
};

// demo_device: the device of the demonstration: a new one, provisioned, or one that was there and
// gets its settings back at the end.
class demo_device {
 public:
  explicit demo_device(const std::string& folder);
  demo_device(const demo_device&) = delete;
  demo_device& operator=(const demo_device&) = delete;
  ~demo_device();

  // start: a fresh instance of the trusted application. stop closes the device, so that other
  // processes may have it.
  keymaster_device* start();
  void stop() { keymaster_.reset(); }

  keymaster::client::session* session() { return keymaster_->session(); }
  const std::string& folder() const { return folder_; }

  // set_version: stops, and changes the system that the device has.
  void set_version(uint32_t os_version, uint32_t os_patchlevel);

 private:
  std::string folder_;
  std::optional<tee::device_settings> original_;
  std::optional<keymaster_device> keymaster_;
};

// show_soter: the sections on SOTER; files go into `scratch`.
void show_soter(narrator* story, demo_device* device, const std::string& scratch);

}  // namespace kmtool
