// Packets over a Unix socket, with a descriptor along.
#include "tee/wire/socket.h"

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

namespace tee::wire {

namespace {

constexpr int KIND = SOCK_SEQPACKET | SOCK_CLOEXEC;
constexpr int WAITING = 128;  // connections that nobody has taken yet

// A path through the folder's descriptor: addresses hold 107 characters at most.
std::string path_in(int place, const std::string& name) {
  return "/proc/self/fd/" + std::to_string(place) + "/" + name;
}

bool fill(const std::string& path, sockaddr_un* address) {
  *address = {};
  address->sun_family = AF_UNIX;
  if (path.size() >= sizeof(address->sun_path)) {
    errno = ENAMETOOLONG;
    return false;
  }
  std::memcpy(address->sun_path, path.data(), path.size());
  return true;
}

const sockaddr* generic(const sockaddr_un& address) {
  return reinterpret_cast<const sockaddr*>(&address);
}

// Room for one descriptor beside a packet.
union descriptor_room {
  char bytes[CMSG_SPACE(sizeof(int))];
  cmsghdr aligned;
};

// The first descriptor that came; further ones are closed.
file_descriptor take_descriptor(msghdr* header) {
  file_descriptor first;
  for (cmsghdr* part = CMSG_FIRSTHDR(header); part != nullptr; part = CMSG_NXTHDR(header, part)) {
    if (part->cmsg_level != SOL_SOCKET || part->cmsg_type != SCM_RIGHTS) continue;
    const size_t count = (part->cmsg_len - CMSG_LEN(0)) / sizeof(int);
    for (size_t i = 0; i < count; i++) {
      int fd = -1;
      std::memcpy(&fd, CMSG_DATA(part) + i * sizeof(int), sizeof(int));
      file_descriptor one(fd);
      if (!first) first = std::move(one);
    }
  }
  return first;
}

}  // namespace

bool read_peer(int socket, peer_credentials* peer) {
  ucred found{};
  socklen_t length = sizeof(found);
  if (getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &found, &length) != 0) return false;
  *peer = {found.pid, found.uid, found.gid};
  return true;
}

file_descriptor connect_in(int place, const std::string& name) {
  file_descriptor made(socket(AF_UNIX, KIND, 0));
  sockaddr_un address{};
  if (!made || !fill(path_in(place, name), &address)) return {};
  int failed = 0;
  do {
    failed = connect(made.get(), generic(address), sizeof(address));
  } while (failed != 0 && errno == EINTR);
  return failed == 0 ? std::move(made) : file_descriptor();
}

file_descriptor listen_in(int place, const std::string& name) {
  const std::string fresh = path_in(place, name + ".new");
  file_descriptor made(socket(AF_UNIX, KIND, 0));
  sockaddr_un address{};
  if (!made || !fill(fresh, &address)) return {};
  constexpr mode_t PRIVATE = 0600;
  unlink(fresh.c_str());  // of one that was killed
  if (bind(made.get(), generic(address), sizeof(address)) != 0 ||
      chmod(fresh.c_str(), PRIVATE) != 0 || listen(made.get(), WAITING) != 0 ||
      rename(fresh.c_str(), path_in(place, name).c_str()) != 0) {
    return {};
  }
  return made;
}

void remove_socket(int place, const std::string& name) {
  unlink(path_in(place, name).c_str());
}

file_descriptor accept_from(int listening) {
  return file_descriptor(accept4(listening, nullptr, nullptr, SOCK_CLOEXEC));
}

bool send(int socket, std::span<const uint8_t> packet, int descriptor) {
  iovec bytes{const_cast<uint8_t*>(packet.data()), packet.size()};
  msghdr header{};
  header.msg_iov = &bytes;
  header.msg_iovlen = 1;
  descriptor_room room{};
  if (descriptor >= 0) {
    header.msg_control = room.bytes;
    header.msg_controllen = sizeof(room.bytes);
    cmsghdr* part = CMSG_FIRSTHDR(&header);
    part->cmsg_level = SOL_SOCKET;
    part->cmsg_type = SCM_RIGHTS;
    part->cmsg_len = CMSG_LEN(sizeof(int));
    std::memcpy(CMSG_DATA(part), &descriptor, sizeof(int));
  }
  ssize_t sent = 0;
  do {
    sent = sendmsg(socket, &header, MSG_NOSIGNAL);
  } while (sent < 0 && errno == EINTR);
  return sent == static_cast<ssize_t>(packet.size());
}

size_t receive(int socket, std::span<uint8_t> into, file_descriptor* descriptor) {
  iovec bytes{into.data(), into.size()};
  msghdr header{};
  header.msg_iov = &bytes;
  header.msg_iovlen = 1;
  descriptor_room room{};
  header.msg_control = room.bytes;
  header.msg_controllen = sizeof(room.bytes);
  ssize_t got = 0;
  do {
    got = recvmsg(socket, &header, MSG_CMSG_CLOEXEC);
  } while (got < 0 && errno == EINTR);
  if (got <= 0) return 0;
  file_descriptor came = take_descriptor(&header);
  if (descriptor != nullptr) *descriptor = std::move(came);
  return (header.msg_flags & MSG_TRUNC) == 0 ? static_cast<size_t>(got) : 0;
}

}  // namespace tee::wire
