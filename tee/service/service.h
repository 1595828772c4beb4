// A device that is served: who is connected, and what ends.
#pragma once

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <ctime>
#include <map>
#include <memory>
#include <mutex>
#include <string>

#include "tee/core/session.h"
#include "tee/service/remote_client.h"
#include "tee/wire/socket.h"

namespace tee::service {

class service_connection;

// One for the process, with a thread for each connection.
class service {
 public:
  static constexpr size_t CONNECTIONS_MAX = 1024;

  service() = default;
  service(const service&) = delete;
  service& operator=(const service&) = delete;
  ~service();

  // open: takes the device in the folder `path` and begins to listen. Failures are traced; codes as
  // open_device, TEE_ERROR_COMMUNICATION when no socket can be made.
  [[nodiscard]] TEE_Result open(const std::string& path);

  // run: serves until stop, until a signal SIGTERM, SIGINT or SIGHUP, until the folder is gone,
  // and, when `idle_seconds` is not 0, until nobody was connected for so long.
  void run(uint32_t idle_seconds);

  // stop: from any thread.
  void stop();

  // For connections.
  session_opener& host() { return *host_; }
  time_t since() const { return since_; }
  bool may_connect(const wire::peer_credentials& peer) const;
  uint32_t add_client(std::shared_ptr<remote_client> client);
  std::shared_ptr<remote_client> find_client(uint32_t number);
  void ended(uint32_t connection);

 private:
  void accept_one();
  void hang_up(uint32_t connection);
  bool folder_is_gone() const;
  void watch(int fd, uint32_t events, uint64_t data);
  void end_connections();

  file_descriptor place_;
  std::shared_ptr<session_opener> host_;
  file_descriptor listening_;
  file_descriptor events_;
  file_descriptor signals_;
  file_descriptor asked_;  // to stop
  time_t since_ = 0;
  std::mutex mutex_;
  std::condition_variable all_ended_;
  uint32_t last_connection_ = 0;
  uint32_t last_client_ = 0;
  std::map<uint32_t, std::shared_ptr<service_connection>> connections_;
  std::map<uint32_t, std::weak_ptr<remote_client>> clients_;
};

}  // namespace tee::service
