// How clients of the normal world reach the trusted applications of a device.
#pragma once

#include "tee_internal_api.h"

#include <memory>

#include "tee/core/session.h"

namespace tee {

// open_device: the host of the device in the folder `path` (null: the default one), which opens
// sessions for as long as it is held; all who open the same device share it. Failures are traced:
// TEE_ERROR_ITEM_NOT_FOUND when there is no device, TEE_ERROR_BUSY when another process has it,
// TEE_ERROR_BAD_FORMAT when it is damaged, TEE_ERROR_ACCESS_DENIED, TEE_ERROR_GENERIC. May throw
// std::bad_alloc.
[[nodiscard]] TEE_Result open_device(const char* path, std::shared_ptr<session_opener>* host);

}  // namespace tee
