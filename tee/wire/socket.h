// Packets over a Unix socket, with a descriptor along.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <sys/types.h>

#include "tee/device/file_descriptor.h"

namespace tee::wire {

// Who is at the other end, as the kernel noted it when the connection was made or listened for.
struct peer_credentials {
  pid_t process;
  uid_t user;
  gid_t group;
};
// False when the kernel does not tell.
[[nodiscard]] bool read_peer(int socket, peer_credentials* peer);

// connect_in: a connection to the socket `name` in the folder that `place` is a descriptor of; none
// with errno. However long the folder's path is.
file_descriptor connect_in(int place, const std::string& name);

// listen_in: a socket that listens under that name, in place of what is there; the name is there
// only when connections are taken. Only its owner may connect. None with errno.
file_descriptor listen_in(int place, const std::string& name);

// remove_socket: the name, so that nobody connects any more.
void remove_socket(int place, const std::string& name);

// accept_from: none with errno.
file_descriptor accept_from(int listening);

// send: one packet with `descriptor` along (-1: none); false when the other end is gone.
[[nodiscard]] bool send(int socket, std::span<const uint8_t> packet, int descriptor = -1);

// receive: waits for one packet. Its length, and the descriptor that came along; 0 when the other
// end is gone or the packet is longer than `into`.
[[nodiscard]] size_t receive(int socket, std::span<uint8_t> into,
                             file_descriptor* descriptor = nullptr);

}  // namespace tee::wire
