// What a client sends to the service of a device, over one connection: packets, each a length
// (u16), what comes along (u8: 1 memory that can be shared, 2 memory that cannot, else nothing) and
// its bytes. The service answers each, ends the connection, or both; it never waits for more than
// comes.
#include <algorithm>
#include <array>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <span>
#include <sys/mman.h>
#include <sys/socket.h>
#include <thread>
#include <vector>

#include "tee/service/service_connection.h"
#include "tee/wire/os_calls.h"
#include "tests/tee/temp_device.h"

namespace {

constexpr size_t MEMORY = 64 * 1024;
constexpr size_t PACKETS = 16;

struct served {
  served() {
    setenv("TEE_TA_PATH", TA_FOLDER, 1);
    setenv("TEE_TRACE_LEVEL", "0", 1);
    if (all.open(made.path()) != TEE_SUCCESS) std::abort();
  }
  tee::test::temp_device made;
  tee::service::service all;
};

tee::file_descriptor companion(uint8_t kind) {
  if (kind == 1) return tee::file_descriptor(os::make_shared_memory(MEMORY));
  if (kind == 2) return tee::file_descriptor(memfd_create("loose", MFD_CLOEXEC));
  return {};
}

// Sends the packets that the input holds, as far as they fit.
void send_all(int socket, std::span<const uint8_t> input) {
  for (size_t i = 0; i < PACKETS && input.size() >= 3; i++) {
    const auto stated = static_cast<uint16_t>(input[0] | input[1] << 8);
    const size_t length = std::min<size_t>(stated, input.size() - 3);
    const tee::file_descriptor along = companion(input[2]);
    if (!tee::wire::send(socket, input.subspan(3, length), along.get())) return;
    input = input.subspan(3 + length);
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static served& service = *new served;
  std::array<int, 2> ends{};
  if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends.data()) != 0) std::abort();
  const tee::file_descriptor client(ends[0]);
  std::thread reader([&] {
    std::vector<uint8_t> packet(tee::wire::MESSAGE_MAX);
    while (tee::wire::receive(client.get(), packet) != 0) {
    }
  });
  {
    tee::service::service_connection connection(service.all, tee::file_descriptor(ends[1]), 1);
    std::thread writer([&] {
      send_all(client.get(), {data, size});
      shutdown(client.get(), SHUT_WR);
    });
    connection.serve();
    connection.hang_up();
    writer.join();
  }
  reader.join();
  return 0;
}
