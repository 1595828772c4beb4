// The messages between a client and the process that serves a device; docs/protocol.md has them as
// tables. A message is one packet of a Unix socket (SOCK_SEQPACKET), numbers are little-endian.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>

namespace tee::wire {

constexpr uint32_t VERSION = 1;
constexpr const char* SOCKET_NAME = "teed.socket";  // in the device's folder

enum class request : uint32_t {
  HELLO = 1,    // a new client
  ATTACH = 2,   // a further connection of a client of the same process
  SHARE = 3,    // memory, whose descriptor comes along
  RELEASE = 4,  // ends that
  OPEN = 5,     // a session
  INVOKE = 6,   // a command
  CLOSE = 7,    // a session
  CANCEL = 8,   // a call on another connection of the client; has no answer
  STATUS = 9,   // who serves
  STOP = 10     // ends the service
};

// Where the bytes of a memory reference are.
enum class place : uint32_t {
  NOWHERE = 0,  // a null reference of size 0
  INLINE = 1,   // in the message
  SHARED = 2    // in shared memory
};

// A parameter of a call. A value: `a`, `b`. Memory: `a` the place, `b` the size; `c` the number of
// the shared memory and `d` the offset in it.
struct slot {
  uint32_t a = 0;
  uint32_t b = 0;
  uint32_t c = 0;
  uint32_t d = 0;
};

struct call {
  uint32_t types = 0;  // TEE_PARAM_TYPE_, 4 bits a slot
  std::array<slot, 4> slots{};
};

// What comes back. Of a value a slot has `a` and `b`; of memory `a` and `b` are the low and the
// high half of the size, which can be above the capacity.
struct answer {
  uint32_t result = 0;  // TEEC_
  uint32_t origin = 0;  // TEEC_ORIGIN_
  uint32_t number = 0;  // what the request made
  uint32_t second = 0;  // what else it has to tell
  std::array<slot, 4> slots{};
};

// Inline bytes of a call: at most so many in each direction, each item padded to ALIGNMENT.
constexpr size_t INLINE_MAX = 32 * 1024;
constexpr size_t ALIGNMENT = 8;
constexpr size_t padded(size_t size) {
  return (size + ALIGNMENT - 1) & ~(ALIGNMENT - 1);
}

constexpr size_t CALL_HEADER = 112;   // at most, before inline bytes
constexpr size_t ANSWER_HEADER = 48;  // exactly
constexpr size_t MESSAGE_MAX = CALL_HEADER + INLINE_MAX;

// Writes numbers and bytes one after the other; what does not fit is not written, and ok() tells.
class writer {
 public:
  explicit writer(std::span<uint8_t> to) : to_(to) {}
  void u32(uint32_t value);
  void bytes(std::span<const uint8_t> value);
  void pad();  // zeros up to ALIGNMENT
  bool ok() const { return ok_; }
  size_t length() const { return at_; }

 private:
  std::span<uint8_t> to_;
  size_t at_ = 0;
  bool ok_ = true;
};

// Reads them again; what is not there reads as zero or nothing, and ok() tells.
class reader {
 public:
  explicit reader(std::span<const uint8_t> from) : from_(from) {}
  uint32_t u32();
  std::span<const uint8_t> bytes(size_t size);
  void pad();
  bool ok() const { return ok_; }
  bool ended() const { return ok_ && at_ == from_.size(); }

 private:
  std::span<const uint8_t> from_;
  size_t at_ = 0;
  bool ok_ = true;
};

void write(writer& to, const call& value);
call read_call(reader& from);
void write(writer& to, const answer& value);
answer read_answer(reader& from);

}  // namespace tee::wire
