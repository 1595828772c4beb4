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
#include <vector>

#include "tee/device/object_name.h"

namespace tee {

class object_store;

// What a device is. Strings are UTF-8 of at most 128 bytes without control characters.
struct device_settings {
  // Fixed by create: the identity, which gpd.tee.deviceID gives to trusted applications and nothing
  // gives to anyone else (nil: a random one; never read back), and whether the device has
  // replay-protected storage.
  TEE_UUID identity{};
  bool rpmb = true;

  TEE_UUID public_id{};  // what stands for the device in public; made of the identity, not set
  std::string manufacturer = "Keymaster";
  std::string implementation_version = "0.1.0";
  uint32_t os_version = 0;     // decimal MMmmss; the tool configures the TA with it
  uint32_t os_patchlevel = 0;  // decimal YYYYMM
};

// public_id_of: the public identifier of the device with that identity. Who knows it does not know
// the identity.
TEE_UUID public_id_of(const TEE_UUID& identity);

// Why a device could not be created, opened or changed; what() is a line for people.
class device_error : public std::runtime_error {
 public:
  enum class kind {
    NOT_FOUND,  // no device at that path
    EXISTS,     // something is there already
    BUSY,       // another process has the device open; what() names its process id
    DAMAGED,    // a file of the device is missing, malformed or not authentic
    EXPOSED,    // a file is another user's or open to others; what() says what to do
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

  // create: makes the folder `path` (mode 0700, missing parents too) with fresh keys, an empty
  // store and its replay table. The folder appears complete or not at all. EXISTS unless nothing or
  // an empty folder is there.
  static void create(const std::string& path, const device_settings& settings);

  // read_settings: the settings of the device at `path`, whether or not a process has it open.
  static device_settings read_settings(const std::string& path);

  // write_settings: replaces the settings of the device at `path` but for what is fixed. BUSY while
  // it is open. Like create, throws std::invalid_argument for texts that break the rule above.
  static void write_settings(const std::string& path, const device_settings& settings);

  // backup: writes everything that the device is to `file` (mode 0600, a new one: EXISTS). Whoever
  // has the file has the device's keys. BUSY while the device is open.
  static void backup(const std::string& path, const std::string& file);

  // restore: makes the folder `path` of such a file, like create, in a new boot. The device is as
  // it was then: of what it counted, signed or forgot since, nothing is known to it. DAMAGED when
  // the file is not a backup or not authentic.
  static void restore(const std::string& file, const std::string& path);

  // reboot: starts a new boot of the device at `path`: a new boot seed, and system time from 0.
  // BUSY while it is open.
  static void reboot(const std::string& path);

  // open: takes the device for this process until the result is destroyed. Starts a new boot when
  // the machine was rebooted since the last one, and brings a folder of the earlier form to the
  // present one. DAMAGED when key, identity, database or replay table are missing or not this
  // device's; IO when the folder cannot be written.
  static std::unique_ptr<device> open(const std::string& path);

  device(const device&) = delete;
  device& operator=(const device&) = delete;
  ~device();

  const std::string& path() const;
  const device_settings& settings() const;

  // in_own_process: whether this is the process that opened the device. One that was forked from it
  // has no part in the device: its store refuses every call.
  bool in_own_process() const;

  // require_at: throws BUSY unless this process can use the device and `path` still leads to it.
  void require_at(const std::string& path) const;

  // identity: what makes the keys of a device without replay-protected storage its own. Secret.
  TEE_UUID identity() const;

  // boot_seed: 32 secret bytes that stay the same for one boot.
  std::span<const uint8_t, BOOT_SEED_LENGTH> boot_seed() const;

  // system_ms: milliseconds since the device's boot; never runs backwards, counts on while the
  // machine sleeps and while no process has the device open.
  uint64_t system_ms() const;

  // ree_ms: the wall clock, milliseconds since 1970; untrusted, may jump.
  uint64_t ree_ms() const;

  // objects: the persistent objects of all trusted applications.
  object_store& objects();

  // has_rpmb: whether the device has replay-protected storage.
  bool has_rpmb() const;

  // check: the objects that fail their check; they are refused and kept. forget: one of them goes
  // away for good, and its name can be used again. Both throw std::runtime_error.
  std::vector<damaged_object> check();
  void forget(const object_name& name);

 private:
  struct state;
  explicit device(std::unique_ptr<state> open_state);
  std::unique_ptr<state> state_;
};

}  // namespace tee
