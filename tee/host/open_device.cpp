// How clients of the normal world reach the trusted applications of a device.
#include "tee/host/open_device.h"

#include <cerrno>

#include "tee/core/log.h"
#include "tee/device/device.h"
#include "tee/device/files.h"
#include "tee/host/ta_host.h"

namespace tee {

namespace {

TEE_Result result_of(const device_error& error) {
  switch (error.reason()) {
    case device_error::kind::NOT_FOUND:
      return TEE_ERROR_ITEM_NOT_FOUND;
    case device_error::kind::BUSY:
      return TEE_ERROR_BUSY;
    case device_error::kind::DAMAGED:
      return TEE_ERROR_BAD_FORMAT;
    case device_error::kind::EXPOSED:
      return TEE_ERROR_ACCESS_DENIED;
    case device_error::kind::EXISTS:
    case device_error::kind::IO:
      break;
  }
  const auto* refused = dynamic_cast<const file_error*>(&error);
  bool denied =
      refused != nullptr && (refused->error_number() == EACCES || refused->error_number() == EPERM);
  return denied ? TEE_ERROR_ACCESS_DENIED : TEE_ERROR_GENERIC;
}

}  // namespace

TEE_Result open_device(const char* path, std::shared_ptr<session_opener>* host) {
  try {
    *host = ta_host::open(path != nullptr ? path : device::default_path());
    return TEE_SUCCESS;
  } catch (const device_error& error) {
    log_line(TEE_TRACE_ERROR, "%s", error.what());
    return result_of(error);
  }
}

}  // namespace tee
