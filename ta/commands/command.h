// The contract between the dispatcher and the command handlers.
#pragma once

#include "ta/base/bytes.h"
#include "ta/base/outcome.h"
#include "ta/params/param_set.h"

namespace keymaster {

// command_io: the slots of one call, unpacked. Input and output are the client's memory, which may
// change while the TA works: input is read once, output is only written.
struct command_io {
  uint32_t argument;       // slot 0 `a` on entry: a purpose, or an operation handle
  uint32_t result = 0;     // slot 0 `b` on return
  byte_view input;         // slot 1
  byte_span output;        // slot 2
  size_t output_size = 0;  // bytes of `output` that were produced; counts on success alone
};

// What a failure of a handler does to the output is in the command table.
using command_handler = outcome (*)(command_io* io);

// One handler a command, under the command's name, which is also the name it traces under.
// docs/command-interface.md has the layout of every buffer.
namespace commands {

outcome generate_key(command_io* io);
outcome get_key_character_size(command_io* io);
outcome get_key_character(command_io* io);
outcome begin(command_io* io);
outcome update(command_io* io);
outcome finish(command_io* io);
outcome import_key(command_io* io);
outcome export_key(command_io* io);
outcome delete_key(command_io* io);
outcome delete_all_key(command_io* io);
outcome _abort(command_io* io);
outcome attest_key(command_io* io);
outcome configure(command_io* io);
outcome upgrade_key(command_io* io);
outcome soter_handle_generate_attk_key_pair(command_io* io);
outcome soter_handle_verify_attk_key_pair(command_io* io);
outcome soter_handle_export_attk_public_key(command_io* io);
outcome soter_handle_get_device_id(command_io* io);
outcome soter_handle_setFid(command_io* io);

}  // namespace commands
}  // namespace keymaster
