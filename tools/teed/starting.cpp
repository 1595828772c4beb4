// Waiting for somebody else who begins to serve the device.
#include <chrono>
#include <thread>

#include "background.h"
#include "tee/wire/connect.h"

namespace teed {

bool wait_while_starting(const std::string& device) {
  constexpr std::chrono::seconds LONGEST{2};
  constexpr std::chrono::milliseconds LOOK{10};
  const auto end = std::chrono::steady_clock::now() + LONGEST;
  while (is_taken(device) && std::chrono::steady_clock::now() < end) {
    if (tee::wire::is_served(device)) return true;
    std::this_thread::sleep_for(LOOK);
  }
  return false;
}

}  // namespace teed
