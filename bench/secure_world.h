// The contender under test: the trusted application on a device of its own, spoken to through the
// command interface alone. Buffers are laid out once, so that only the commands are measured.
#pragma once

#include "tee_internal_api.h"

#include <optional>
#include <string>

#include "keymaster/client/session.h"

namespace keymaster::bench {

using client::byte_view;
using client::bytes;
using client::param_set;

// pattern: bytes that differ from each other, as input or key.
bytes pattern(size_t length);

class secure_world {
 public:
  // Makes a device without replay-protected storage in a temporary folder, starts the trusted
  // application and configures it. `way`: what stands before the folder in the device's name.
  explicit secure_world(const std::string& way = "local:");
  secure_world(const secure_world&) = delete;
  secure_world& operator=(const secure_world&) = delete;
  ~secure_world();

  // import_key, generate_key: the key's blob; std::runtime_error when refused.
  bytes import_key(const param_set& description, byte_view key_data);
  bytes generate_key(const param_set& description);

  client::connection& commands() { return *commands_; }
  const TEE_UUID& device_id() const { return device_id_; }

 private:
  std::string folder_;
  TEE_UUID device_id_{};
  std::optional<client::session> session_;
  std::optional<client::connection> commands_;
};

// command: one command with its buffers, sent as often as one likes.
class command {
 public:
  command(secure_world* world, client::command id, bytes input, size_t output_capacity);

  // run: sends it with `argument` in slot 0 `a` and gives back slot 0 `b`. std::runtime_error when
  // the command is refused.
  uint32_t run(uint32_t argument = 0);

  byte_view output() const { return byte_view(output_).first(produced_); }

 private:
  client::connection* commands_;
  uint32_t id_;
  bytes input_;
  bytes output_;
  size_t produced_ = 0;
};

// operation: begin, one update with all of `input`, and finish.
class operation {
 public:
  operation(secure_world* world, uint32_t purpose, byte_view blob, const param_set& begin_params,
            byte_view input, byte_view signature = {});

  void run();

  // Of the last run: begin's marshalled parameters, what update put out, finish's output.
  byte_view begun() const { return begin_.output(); }
  byte_view updated() const { return update_.output(); }
  bytes finished() const;

 private:
  uint32_t purpose_;
  command begin_;
  command update_;
  command finish_;
};

}  // namespace keymaster::bench
