// A program's tie to the process that serves a device.
#pragma once

#include "tee_client_api.h"

#include <array>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <span>
#include <string>
#include <sys/types.h>
#include <vector>

#include "tee/wire/records.h"
#include "tee/wire/shared_mapping.h"
#include "tee/wire/socket.h"

namespace tee::remote {

// One connection: one call at a time.
struct connection {
  explicit connection(file_descriptor connected) : socket(std::move(connected)) {}
  connection(const connection&) = delete;
  connection& operator=(const connection&) = delete;
  ~connection() { wipe(packet.size()); }

  // wipe: forgets what the first `used` bytes of the packet were.
  void wipe(size_t used);

  file_descriptor socket;
  uint32_t number = 0;        // as the server counts connections
  uint32_t last_call = 0;     // as this end counts calls
  wire::shared_mapping area;  // for memory that is too large for a packet
  uint32_t area_number = 0;
  std::array<uint8_t, wire::MESSAGE_MAX> packet{};
};

// What a context is at the server: a client there. Safe to use from any thread; each call has a
// connection to itself. It ends when the server does, and with the process that made it.
class link {
 public:
  // open: to whoever serves the device in the folder `path`; started when nobody does. What fails
  // is traced: TEEC_ERROR_ITEM_NOT_FOUND when there is no device, TEEC_ERROR_BUSY when a process
  // that does not serve it has it, TEEC_ERROR_BAD_FORMAT when it is damaged,
  // TEEC_ERROR_ACCESS_DENIED, TEEC_ERROR_COMMUNICATION.
  static TEEC_Result open(const std::string& path, std::shared_ptr<link>* opened);

  link(file_descriptor place, std::unique_ptr<connection> first, uint32_t client);

  // usable: whether the server was there when last heard of, and this process made the link.
  bool usable() const;
  bool at_home() const;

  // take: a connection for one call; null when none can be had. give_back: takes it again; one that
  // failed ends the link.
  std::unique_ptr<connection> take();
  void give_back(std::unique_ptr<connection> used, bool failed);

  // ask: a request that has neither memory nor a result of its own, over a connection of the link;
  // false when the server is gone.
  [[nodiscard]] bool ask(const std::function<void(wire::writer&)>& write, wire::answer* answer,
                         int descriptor = -1);

  // cancel: requests the end of a call on a connection of this link.
  void cancel(uint32_t connection, uint32_t call);

 private:
  std::unique_ptr<connection> attach() const;

  const pid_t process_;
  const file_descriptor place_;  // the device's folder
  const uint32_t client_;        // its number at the server
  mutable std::mutex mutex_;
  bool ended_ = false;
  std::vector<std::unique_ptr<connection>> idle_;
};

// exchange: sends the first `length` bytes of the connection's packet and receives the answer into
// it; its length, or 0 when the server is gone.
size_t exchange(connection& over, size_t length, int descriptor = -1);

}  // namespace tee::remote
