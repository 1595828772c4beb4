// The way of an update's data from the client's memory through the cipher and back.
#pragma once

#include "ta/alg/aes/aes_operation.h"

namespace keymaster {

// aes_transfer: passes data through the cipher into the output of an update. The platform works on
// the client's memory in place, unless the output shares memory with the command's input: a
// platform may refuse that, and what is written may be what is still to be read. Then input and
// output go through the TA's memory in pieces, and input is read as far ahead as the output can
// reach. `body` is the part of the step's input that goes through; the caller reads the rest of it,
// if it needs it, before start.
class aes_transfer {
 public:
  aes_transfer(aes_encrypt_operation_t* operation, update_step* step, byte_view body)
      : operation_(operation), step_(step), body_(body) {}

  // start: comes before the first byte of output. -41: out of memory.
  [[nodiscard]] keymaster_error_t start();
  // put: writes `bytes` to the output as they are; false when there is no room.
  [[nodiscard]] bool put(byte_view bytes);
  // feed: passes a few bytes of the TA's through the cipher, at most those of a piece.
  [[nodiscard]] TEE_Result feed(byte_view bytes);
  // feed_body: passes the body through, all of it.
  [[nodiscard]] TEE_Result feed_body();

 private:
  size_t window_size() const;
  void read_ahead();

  aes_encrypt_operation_t* operation_;
  update_step* step_;
  byte_view body_;      // what is not read yet
  heap_buffer window_;  // body that is read and not fed: the first `read_` bytes
  size_t read_ = 0;
  heap_buffer made_;  // what the cipher makes of one piece; none when the platform works in place
};

}  // namespace keymaster
