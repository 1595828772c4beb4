// Whether a device is served.
#pragma once

#include <string>

namespace tee::wire {

// is_served: whether somebody takes connections for the device in the folder `path`.
bool is_served(const std::string& path);

}  // namespace tee::wire
