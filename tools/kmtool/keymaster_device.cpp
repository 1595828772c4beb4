// Opening of devices and of the trusted applications that the tool speaks with.
#include "keymaster_device.h"

#include "tee/wire/connect.h"
#include "tool.h"

namespace kmtool {

namespace client = keymaster::client;

failure session_failure(const std::string& application, const client::open_error& error) {
  std::string advice(error.reason().advice());
  if (error.reason().tee == TEEC_ERROR_ITEM_NOT_FOUND) {
    advice = "It is looked for in $TEE_TA_PATH, or else beside the TEE's library.";
  }
  return {"cannot start the " + application, error.reason(), advice};
}

namespace {

constexpr TEEC_Result MAC_INVALID = 0xFFFF3071;  // no code of the client API

client::session open_keymaster(const client::context& tee) try {
  return client::session(tee);
} catch (const client::open_error& error) {
  throw session_failure("Keymaster trusted application", error);
}

}  // namespace

client::context open_device(const std::string& name) try {
  return client::context(name);
} catch (const client::open_error& error) {
  // The client API has a code alone; opening the folder itself gives the reason in words, such as
  // which process has it open.
  const std::string folder(tee::wire::folder_of(name));
  if (!tee::wire::is_served(folder)) tee::device::open(folder);
  throw failure("cannot open the device in " + folder, error.reason());
}

client::bytes issue_token(const client::context& tee, const client::token_request& request) try {
  client::data_result token = client::authenticator(tee).issue(request);
  require(token, "the authenticator issued no token");
  return token.data;
} catch (const client::open_error& error) {
  throw session_failure("authenticator", error);
}

void report_fingerprint(const keymaster_device& keymaster, uint32_t fid) try {
  require(client::fingerprint_sensor(keymaster.context()).report_match(fid),
          "the fingerprint was not accepted");
} catch (const client::open_error& error) {
  throw session_failure("fingerprint application", error);
}

void require_own(const std::string& path, const client::status& upgraded) {
  const bool foreign = upgraded.tee == TEEC_ERROR_ITEM_NOT_FOUND ||
                       upgraded.tee == TEEC_ERROR_BAD_FORMAT || upgraded.tee == MAC_INVALID;
  if (!foreign) return;
  throw failure(REFUSED, path + " is no key of this device",
                "It is damaged, belongs to another device, or is another kind of file.");
}

void require_opened(client::session* keymaster, const std::string& path, client::byte_view blob,
                    const client::application& application, const client::status& asked) {
  if (asked.error == keymaster::KM_ERROR_KEY_REQUIRES_UPGRADE) {
    client::param_set params;
    application.bind(&params);
    require_own(path, keymaster->upgrade_key(blob, params));
  }
  require(asked, "cannot open the key");
}

keymaster_device::keymaster_device(const std::string& name)
    : settings_(tee::device::read_settings(std::string(tee::wire::folder_of(name)))),
      context_(open_device(name)),
      session_(open_keymaster(context_)) {
  require(session_.configure(settings_.os_version, settings_.os_patchlevel),
          "cannot configure the device");
}

}  // namespace kmtool
