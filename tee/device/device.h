// A device: the folder in which the host TEE keeps its identity, its boot, its keys and its
// storage. kmtool creates and administers devices through this header; the TEE opens one for its
// process.
#pragma once

#include "tee_internal_api.h"

#include <array>
#include <cstdint>
#include <memory>
#include <span>
#include <stdexcept>
#include <string>

namespace tee {

class object_store;

// What a device is. Strings are UTF-8 of at most 128 bytes without control characters.
struct device_settings {
  TEE_UUID id{};  // what gpd.tee.deviceID gives; see new_uuid() in uuid.h
  std::string manufacturer = "Keymaster";
  std::string implementation_version = "0.1.0";
  bool rpmb = true;            // whether it has replay-protected storage
  uint32_t os_version = 0;     // decimal MMmmss; the tool configures the TA with it
  uint32_t os_patchlevel = 0;  // decimal YYYYMM
};

// Why a device could not be created, opened or changed; what() is a line for people.
class device_error : public std::runtime_error {
 public:
  enum class kind {
    NOT_FOUND,  // no device at that path
    EXISTS,     // something is there already
    BUSY,       // another process has the device open; what() names its process id
    DAMAGED,    // a file of the device is missing, malformed or not authentic
    IO          // the operating system refused
  };
  device_error(kind reason, const std::string& what) : std::runtime_error(what), reason_(reason) {}
  kind reason() const { return reason_; }

 private:
  kind reason_;
};

// An open device. One process at a time has it open; within the process it may be used from several
// threads. Every function that can fail throws device_error.
class device {
 public:
  static constexpr size_t BOOT_SEED_LENGTH = 32;

  // default_path: $KEYMASTER_DEVICE, else $XDG_STATE_HOME/keymaster/device, else
  // ~/.local/state/keymaster/device.
  static std::string default_path();

  // create: makes the folder `path` (mode 0700, missing parents too) with fresh keys and an empty
  // store. The folder appears complete or not at all. EXISTS unless nothing or an empty folder is
  // there.
  static void create(const std::string& path, const device_settings& settings);

  // read_settings: the settings of the device at `path`, whether or not a process has it open.
  static device_settings read_settings(const std::string& path);

  // write_settings: replaces the settings of the device at `path`. BUSY while it is open. Like
  // create, throws std::invalid_argument for texts that break the rule above.
  static void write_settings(const std::string& path, const device_settings& settings);

  // reboot: starts a new boot of the device at `path`: a new boot seed, and system time from 0.
  // BUSY while it is open.
  static void reboot(const std::string& path);

  // open: takes the device for this process until the result is destroyed. Starts a new boot when
  // the machine was rebooted since the last one.
  static std::unique_ptr<device> open(const std::string& path);

  device(const device&) = delete;
  device& operator=(const device&) = delete;
  ~device();

  const std::string& path() const;
  const device_settings& settings() const;

  // boot_seed: 32 secret bytes that stay the same for one boot.
  std::span<const uint8_t, BOOT_SEED_LENGTH> boot_seed() const;

  // system_ms: milliseconds since the device's boot; never runs backwards, counts on while the
  // machine sleeps and while no process has the device open.
  uint64_t system_ms() const;

  // ree_ms: the wall clock, milliseconds since 1970; untrusted, may jump.
  uint64_t ree_ms() const;

  // objects: the persistent objects of all trusted applications.
  object_store& objects();

  // has_rpmb: whether the device has replay-protected storage at all.
  bool has_rpmb() const;

  // make_rpmb: makes the file system of the replay-protected storage when it is not there yet;
  // erases nothing. False when the device has no such storage or it cannot be made.
  bool make_rpmb() noexcept;

 private:
  struct state;
  explicit device(std::unique_ptr<state> open_state);
  std::unique_ptr<state> state_;
};

}  // namespace tee
