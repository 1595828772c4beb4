// A device that is served.
#include "tee/service/service.h"

#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/signalfd.h>
#include <sys/stat.h>
#include <system_error>
#include <thread>
#include <unistd.h>
#include <utility>

#include "tee/core/log.h"
#include "tee/host/open_device.h"
#include "tee/service/service_connection.h"
#include "tee/wire/os_calls.h"
#include "tee/wire/records.h"

namespace tee::service {

namespace {

// What events are of, where a connection has its number.
constexpr uint64_t LISTENING = uint64_t{1} << 32;
constexpr uint64_t STOPPING = LISTENING + 1;

constexpr std::chrono::milliseconds PAUSE{10};
constexpr int LOOK_MS = 1000;  // how often the folder is looked for

TEE_Result no_socket(const std::string& path) {
  log_line(TEE_TRACE_ERROR, "cannot listen in %s: %s", path.c_str(),
           std::generic_category().message(errno).c_str());
  return TEE_ERROR_COMMUNICATION;
}

}  // namespace

service::~service() = default;

TEE_Result service::open(const std::string& path) {
  if (TEE_Result res = open_device(path.c_str(), &host_)) return res;
  place_ = file_descriptor(os::open_place(path.c_str()));
  // From here on the folder is this process's alone.
  if (place_) listening_ = wire::listen_in(place_.get(), wire::SOCKET_NAME);
  if (!listening_) return no_socket(path);
  sigset_t ends;
  sigemptyset(&ends);
  for (int signal : {SIGTERM, SIGINT, SIGHUP})
    sigaddset(&ends, signal);
  pthread_sigmask(SIG_BLOCK, &ends, nullptr);
  signals_ = file_descriptor(signalfd(-1, &ends, SFD_CLOEXEC));
  asked_ = file_descriptor(eventfd(0, EFD_CLOEXEC));
  events_ = file_descriptor(epoll_create1(EPOLL_CLOEXEC));
  if (!signals_ || !asked_ || !events_) return no_socket(path);
  watch(listening_.get(), EPOLLIN, LISTENING);
  watch(signals_.get(), EPOLLIN, STOPPING);
  watch(asked_.get(), EPOLLIN, STOPPING);
  since_ = time(nullptr);
  return TEE_SUCCESS;
}

void service::watch(int fd, uint32_t events, uint64_t data) {
  epoll_event event{};
  event.events = events;
  event.data.u64 = data;
  epoll_ctl(events_.get(), EPOLL_CTL_ADD, fd, &event);
}

void service::stop() {
  eventfd_write(asked_.get(), 1);
}

void service::run(uint32_t idle_seconds) {
  using clock = std::chrono::steady_clock;
  auto last_busy = clock::now();
  bool serving = true;
  while (serving && !folder_is_gone()) {
    epoll_event event{};
    const int count = epoll_wait(events_.get(), &event, 1, LOOK_MS);
    if (count > 0 && event.data.u64 == LISTENING) accept_one();
    if (count > 0 && event.data.u64 == STOPPING) serving = false;
    if (count > 0 && event.data.u64 < LISTENING) hang_up(static_cast<uint32_t>(event.data.u64));
    std::lock_guard lock(mutex_);
    if (!connections_.empty()) last_busy = clock::now();
    if (idle_seconds != 0 && clock::now() - last_busy >= std::chrono::seconds(idle_seconds)) {
      serving = false;
    }
  }
  // The name goes first: who comes now starts a service of his own, which waits for the folder.
  wire::remove_socket(place_.get(), wire::SOCKET_NAME);
  listening_ = {};
  end_connections();
}

bool service::folder_is_gone() const {
  struct stat status {};
  return fstat(place_.get(), &status) != 0 || status.st_nlink == 0;
}

void service::accept_one() {
  file_descriptor socket = wire::accept_from(listening_.get());
  if (!socket) {  // often for want of descriptors: not again at once
    std::this_thread::sleep_for(PAUSE);
    return;
  }
  std::unique_lock lock(mutex_);
  if (connections_.size() >= CONNECTIONS_MAX) return;
  const uint32_t number = ++last_connection_;
  const int fd = socket.get();
  auto made = std::make_shared<service_connection>(*this, std::move(socket), number);
  connections_.emplace(number, made);
  lock.unlock();
  watch(fd, EPOLLET, number);  // hang-ups alone
  try {
    std::thread([made = std::move(made)] {
      made->serve();
      made->owner().ended(made->number());
    }).detach();
  } catch (const std::system_error&) {
    ended(number);
  }
}

void service::hang_up(uint32_t connection) {
  std::unique_lock lock(mutex_);
  auto found = connections_.find(connection);
  if (found == connections_.end()) return;
  auto gone = found->second;
  lock.unlock();
  gone->peer_is_gone();
}

void service::ended(uint32_t connection) {
  std::lock_guard lock(mutex_);
  connections_.erase(connection);
  if (connections_.empty()) all_ended_.notify_all();
}

// Calls in progress are asked to end; one that never does is left behind with the process.
void service::end_connections() {
  std::unique_lock lock(mutex_);
  auto all = connections_;
  lock.unlock();
  for (auto& [number, one] : all)
    one->hang_up();
  all.clear();
  lock.lock();
  const auto grace = runaway_grace() + std::chrono::seconds(1);
  if (!all_ended_.wait_for(lock, grace, [&] { return connections_.empty(); })) {
    log_line(TEE_TRACE_ERROR, "a trusted application does not end");
    _exit(EXIT_FAILURE);
  }
}

bool service::may_connect(const wire::peer_credentials& peer) const {
  return peer.user == geteuid() || peer.user == 0;
}

uint32_t service::add_client(std::shared_ptr<remote_client> client) {
  std::lock_guard lock(mutex_);
  std::erase_if(clients_, [](const auto& entry) { return entry.second.expired(); });
  clients_[++last_client_] = std::move(client);
  return last_client_;
}

std::shared_ptr<remote_client> service::find_client(uint32_t number) {
  std::lock_guard lock(mutex_);
  auto found = clients_.find(number);
  return found == clients_.end() ? nullptr : found->second.lock();
}

}  // namespace tee::service
