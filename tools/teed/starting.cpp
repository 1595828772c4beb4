// Waiting for somebody else who begins to serve the device.
#include <thread>

#include "background.h"
#include "tee/wire/connect.h"

namespace teed {

bool wait_while_starting(const std::string& device) {
  constexpr std::chrono::milliseconds LOOK{10};
  const auto end = std::chrono::steady_clock::now() + STARTING;
  while (is_taken(device) && std::chrono::steady_clock::now() < end) {
    if (tee::wire::is_served(device)) return true;
    std::this_thread::sleep_for(LOOK);
  }
  return false;
}

}  // namespace teed
