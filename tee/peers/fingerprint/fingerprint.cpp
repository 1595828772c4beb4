// Fingerprint: says which fingerprint was matched. It stands where a device has the application
// that drives its sensor, and reports to the Keymaster TA whatever match it is told of.
//
// Command 1, report a match. Slot 0, value input: a, the fingerprint's identifier. The result is
// that of the Keymaster TA's command 0xFF04, or of opening a session with it.
// TEE_ERROR_BAD_PARAMETERS for other slots, TEE_ERROR_NOT_SUPPORTED for other commands.
//
// The report, 16 bytes, little-endian: version (u32, 0); identifier (u32); time of the match,
// milliseconds of the TEE's system time (u64).
#include "tee_internal_api.h"

#include <cstddef>
#include <cstdint>

#include "tee/peers/support.h"

namespace {

constexpr uint32_t COMMAND_REPORT_MATCH = 1;

constexpr TEE_UUID KEYMASTER = KEYMASTER_TA_UUID;
constexpr uint32_t COMMAND_SET_FID = 0xFF04;

constexpr size_t ID_OFFSET = 4;
constexpr size_t TIME_OFFSET = 8;
constexpr size_t REPORT_SIZE = 16;

void fill_report(uint32_t fid, uint8_t* report) {
  TEE_Time now;
  TEE_GetSystemTime(&now);
  peers::store_little_endian(report, 0, ID_OFFSET);
  peers::store_little_endian(report + ID_OFFSET, fid, TIME_OFFSET - ID_OFFSET);
  peers::store_little_endian(report + TIME_OFFSET, uint64_t{now.seconds} * 1000 + now.millis,
                             REPORT_SIZE - TIME_OFFSET);
}

TEE_Result report_match(uint32_t fid) {
  TEE_TASessionHandle session = TEE_HANDLE_NULL;
  TEE_Result res =
      TEE_OpenTASession(&KEYMASTER, TEE_TIMEOUT_INFINITE, 0, nullptr, &session, nullptr);
  if (res != TEE_SUCCESS) return res;
  uint8_t report[REPORT_SIZE];
  fill_report(fid, report);
  TEE_Param params[4] = {};
  params[1].memref = {report, sizeof(report)};
  res = TEE_InvokeTACommand(session, TEE_TIMEOUT_INFINITE, COMMAND_SET_FID,
                            TEE_PARAM_TYPES(0, TEE_PARAM_TYPE_MEMREF_INPUT, 0, 0), params, nullptr);
  TEE_CloseTASession(session);
  return res;
}

}  // namespace

TEE_Result TA_InvokeCommandEntryPoint(void* /*sessionContext*/, uint32_t commandID,
                                      uint32_t paramTypes, TEE_Param* params) {
  if (commandID != COMMAND_REPORT_MATCH) return TEE_ERROR_NOT_SUPPORTED;
  if (paramTypes != TEE_PARAM_TYPES(TEE_PARAM_TYPE_VALUE_INPUT, 0, 0, 0)) {
    return TEE_ERROR_BAD_PARAMETERS;
  }
  return report_match(params[0].value.a);
}
