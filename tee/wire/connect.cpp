// Whether a device is served.
#include "tee/wire/connect.h"

#include "tee/wire/os_memory.h"
#include "tee/wire/records.h"
#include "tee/wire/socket.h"

namespace tee::wire {

bool is_served(const std::string& path) {
  const file_descriptor place(os::open_place(path.c_str()));
  return place && connect_in(place.get(), SOCKET_NAME);
}

}  // namespace tee::wire
