// Starting the process that serves a device.
#pragma once

#include "tee_client_api.h"

#include <string>

namespace tee::remote {

// start_service: starts teed for the device in the folder `path` and waits until somebody, it or a
// faster one, takes connections. Failures are traced, here or by teed; codes as link::open.
TEEC_Result start_service(const std::string& path);

}  // namespace tee::remote
