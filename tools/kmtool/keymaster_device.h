// The device of a call: opened, and its Keymaster configured.
#pragma once

#include <string>

#include "keymaster/client/authenticator.h"
#include "keymaster/client/session.h"
#include "keymaster/client/soter.h"
#include "tee/device/device.h"
#include "tool.h"

namespace kmtool {

// open_device: a context on the device of that name. Throws failure, or tee::device_error with the
// reason in words when the folder cannot be opened.
keymaster::client::context open_device(const std::string& name);

// session_failure: that a trusted application of the device cannot be reached.
failure session_failure(const std::string& application, const keymaster::client::open_error& error);

// issue_token: a token from the device's authenticator. Throws failure.
keymaster::client::bytes issue_token(const keymaster::client::context& tee,
                                     const keymaster::client::token_request& request);

// keymaster_device: a session with a device's Keymaster, configured with the device's OS version
// and patch level.
class keymaster_device {
 public:
  // Throws what open_device throws.
  explicit keymaster_device(const std::string& name);

  keymaster::client::session* operator->() { return &session_; }
  keymaster::client::session* session() { return &session_; }
  const keymaster::client::context& context() const { return context_; }
  const tee::device_settings& settings() const { return settings_; }

 private:
  tee::device_settings settings_;
  keymaster::client::context context_;
  keymaster::client::session session_;
};

// require_opened: throws failure unless the blob from the file `path` opened, as `asked` tells. One
// that does not open after an upgrade either is no key of this device; whether it would is tried.
void require_opened(keymaster::client::session* keymaster, const std::string& path,
                    keymaster::client::byte_view blob,
                    const keymaster::client::application& application,
                    const keymaster::client::status& asked);

// require_own: throws failure when an upgrade of the blob from the file `path` ended as that of
// something that neither this Keymaster nor the earlier one opens.
void require_own(const std::string& path, const keymaster::client::status& upgraded);

// report_fingerprint: has the device's fingerprint application report a match to this Keymaster.
// Throws failure.
void report_fingerprint(const keymaster_device& keymaster, uint32_t fid);

}  // namespace kmtool
