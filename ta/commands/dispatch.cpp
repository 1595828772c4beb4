// The dispatcher: the command table, the checks that all commands share, and how an outcome goes
// back to the client.
#include "ta/commands/dispatch.h"

#include "tee_internal_api.h"

#include "ta/base/outcome.h"
#include "ta/commands/command.h"
#include "ta/commands/configured.h"

namespace keymaster {
namespace {

// What slot 0 must hold on entry. A VALUE_OUTPUT slot is checked too, though its fields are the
// platform's to set: intended.
enum class slot0_rule : uint8_t { BOTH_ZERO, B_ZERO, UNUSED };

// What a failed command does to slot 2.
enum class failure_rule : uint8_t {
  SIZE_ZERO,
  CLEAR_AND_SIZE_ZERO,  // the declared output is zeroed as well
  CLEAR,                // zeroed, but the size stays
  UNTOUCHED,
};

struct command_row {
  uint32_t id;
  const char* name;
  uint32_t types;
  slot0_rule slot0;
  bool needs_configured;
  failure_rule on_failure;
  command_handler handler;
};

constexpr uint32_t VALUE_ONLY = 0x3;
constexpr uint32_t VALUE_IN = 0x53;
constexpr uint32_t VALUE_IN_OUT = 0x653;
constexpr uint32_t VALUE_OUT = 0x602;
constexpr uint32_t IN_ONLY = 0x50;

using enum slot0_rule;
using enum failure_rule;

constexpr command_row COMMANDS[] = {
    {13, "generate_key", VALUE_IN_OUT, BOTH_ZERO, true, CLEAR_AND_SIZE_ZERO,
     commands::generate_key},
    {14, "get_key_character_size", VALUE_IN, BOTH_ZERO, true, SIZE_ZERO,
     commands::get_key_character_size},
    {15, "get_key_character", VALUE_IN_OUT, BOTH_ZERO, true, SIZE_ZERO,
     commands::get_key_character},
    {16, "begin", VALUE_IN_OUT, B_ZERO, true, SIZE_ZERO, commands::begin},
    {17, "update", VALUE_IN_OUT, B_ZERO, true, SIZE_ZERO, commands::update},
    {18, "finish", VALUE_IN_OUT, B_ZERO, true, SIZE_ZERO, commands::finish},
    {19, "import_key", VALUE_IN_OUT, BOTH_ZERO, true, CLEAR, commands::import_key},
    {20, "export_key", VALUE_IN_OUT, BOTH_ZERO, true, SIZE_ZERO, commands::export_key},
    {21, "delete_key", VALUE_IN, BOTH_ZERO, true, SIZE_ZERO, commands::delete_key},
    {22, "delete_all_key", VALUE_ONLY, BOTH_ZERO, true, SIZE_ZERO, commands::delete_all_key},
    {23, "_abort", VALUE_ONLY, B_ZERO, true, SIZE_ZERO, commands::_abort},
    {24, "attest_key", VALUE_IN_OUT, BOTH_ZERO, true, SIZE_ZERO, commands::attest_key},
    {25, "configure", VALUE_IN, BOTH_ZERO, false, SIZE_ZERO, commands::configure},
    {26, "upgrade_key", VALUE_IN_OUT, BOTH_ZERO, true, UNTOUCHED, commands::upgrade_key},
    {0xFF00, "soter_handle_generate_attk_key_pair", VALUE_ONLY, B_ZERO, false, SIZE_ZERO,
     commands::soter_handle_generate_attk_key_pair},
    {0xFF01, "soter_handle_verify_attk_key_pair", VALUE_ONLY, BOTH_ZERO, false, SIZE_ZERO,
     commands::soter_handle_verify_attk_key_pair},
    {0xFF02, "soter_handle_export_attk_public_key", VALUE_OUT, BOTH_ZERO, false, SIZE_ZERO,
     commands::soter_handle_export_attk_public_key},
    {0xFF03, "soter_handle_get_device_id", VALUE_OUT, BOTH_ZERO, false, SIZE_ZERO,
     commands::soter_handle_get_device_id},
    {0xFF04, "soter_handle_setFid", IN_ONLY, UNUSED, false, SIZE_ZERO,
     commands::soter_handle_setFid},
};

const command_row* find_command(uint32_t id) {
  for (const command_row& row : COMMANDS) {
    if (row.id == id) return &row;
  }
  return nullptr;
}

bool has_output(const command_row& row) {
  return TEE_PARAM_TYPE_GET(row.types, 2) == TEE_PARAM_TYPE_MEMREF_OUTPUT;
}

TEE_Result check_parameters(const command_row& row, uint32_t types, const TEE_Param* params) {
  if (types != row.types) {
    return row.types == IN_ONLY ? fail(TEE_ERROR_BAD_PARAMETERS, "Bad argument type 0x%x\n", types)
                                : fail(TEE_ERROR_BAD_PARAMETERS, "Bad argument type\n");
  }
  const bool a_refused = row.slot0 == BOTH_ZERO && params[0].value.a != 0;
  const bool b_refused = row.slot0 != UNUSED && params[0].value.b != 0;
  if (a_refused || b_refused) return fail(TEE_ERROR_BAD_PARAMETERS, "Bad argument\n");
  return TEE_SUCCESS;
}

// The slots as the handler sees them. A null buffer is an empty one whatever its size says.
command_io unpack(const command_row& row, const TEE_Param* params) {
  command_io io{};
  if (row.slot0 != UNUSED) io.argument = params[0].value.a;
  const auto& in = params[1].memref;
  if (TEE_PARAM_TYPE_GET(row.types, 1) == TEE_PARAM_TYPE_MEMREF_INPUT && in.buffer != nullptr) {
    io.input = {static_cast<const uint8_t*>(in.buffer), in.size};
  }
  const auto& out = params[2].memref;
  if (has_output(row) && out.buffer != nullptr) {
    io.output = {static_cast<uint8_t*>(out.buffer), out.size};
  }
  return io;
}

outcome run(const command_row& row, command_io* io) {
  if (row.needs_configured && !configured().is_configured) {
    const trace_scope scope(row.name);
    return refuse(KM_ERROR_KEYMASTER_NOT_CONFIGURED, "Not configured");
  }
  return row.handler(io);
}

void settle_output(const command_row& row, const command_io& io, bool done, TEE_Param* params) {
  if (!has_output(row)) return;
  if (done) {
    params[2].memref.size = static_cast<tee_size>(io.output_size);
    return;
  }
  const bool clear = row.on_failure == CLEAR || row.on_failure == CLEAR_AND_SIZE_ZERO;
  if (clear) wipe(io.output);
  if (row.on_failure == SIZE_ZERO || row.on_failure == CLEAR_AND_SIZE_ZERO) {
    params[2].memref.size = 0;
  }
}

}  // namespace

TEE_Result dispatch(uint32_t command, uint32_t types, TEE_Param* params) {
  const command_row* row = find_command(command);
  if (row == nullptr) return fail(TEE_ERROR_BAD_PARAMETERS, "Unknown command %x\n", command);
  trace(TEE_TRACE_INFO, "%s", row->name);
  TRY(check_parameters(*row, types, params));

  command_io io = unpack(*row, params);
  const outcome how = run(*row, &io);
  settle_output(*row, io, !failed(how), params);
  if (row->slot0 != UNUSED) {
    params[0].value.a = static_cast<uint32_t>(how.error);
    params[0].value.b = io.result;
  }
  return how.tee;
}

}  // namespace keymaster
