// Who serves a device, and an end to that.
#pragma once

#include <ctime>
#include <optional>
#include <string>
#include <string_view>
#include <sys/types.h>

namespace tee::wire {

// is_served: whether somebody takes connections for the device in the folder `path`.
bool is_served(const std::string& path);

struct service_status {
  pid_t process;
  time_t since;
};

// find_service: who serves it; nothing when nobody does or he does not answer.
std::optional<service_status> find_service(const std::string& path);

// stop_service: has the service end, and waits for that; false when it does not within 20 s. True
// when there is none.
[[nodiscard]] bool stop_service(const std::string& path);

// What stands before a folder's path in the name of a device, and the path behind it.
constexpr std::string_view SERVED = "teed:";
constexpr std::string_view IN_PROCESS = "local:";
inline std::string_view folder_of(std::string_view name) {
  for (std::string_view prefix : {SERVED, IN_PROCESS})
    if (name.starts_with(prefix)) return name.substr(prefix.size());
  return name;
}

}  // namespace tee::wire
