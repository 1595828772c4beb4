// The platform's extensions on OP-TEE. Cryptography is the adapter's.
#include "tee_extensions.h"

#include <algorithm>
#include <cstddef>

#include "ports/optee/boot_seed/boot_seed.h"

// Of the kit's library: a line for the secure console, and the highest level that is let through.
// Levels are numbered as ours are.
extern "C" void trace_ext_puts(const char* line);
extern "C" int trace_get_level();

namespace {

constexpr size_t MAX_LINE_SIZE = 256;

using tee_size = decltype(TEE_Param{}.memref.size);

TEE_Result read_seed(TEE_TASessionHandle session, void* seed, size_t length) {
  TEE_Param params[4] = {};
  params[0].memref.buffer = seed;
  params[0].memref.size = static_cast<tee_size>(length);
  constexpr uint32_t TYPES = TEE_PARAM_TYPE_MEMREF_OUTPUT;  // in slot 0; the others are not used
  return TEE_InvokeTACommand(session, TEE_TIMEOUT_INFINITE, BOOT_SEED_GET, TYPES, params, nullptr);
}

}  // namespace

// The storage is there from the first start of OP-TEE on, or it is not; whichever, opening and
// creating say so. Answering that there is none would let the trusted application do with a key
// that is derived from the device's identifier, which every trusted application may read.
TEE_Result TEE_RPMB_MakeFileSystem(uint32_t* state) {
  *state = 1;
  return TEE_SUCCESS;
}

TEE_Result GetBootSeed(void* seed, size_t length) {
  if (length != BOOT_SEED_SIZE) return TEE_ERROR_BAD_PARAMETERS;
  constexpr TEE_UUID BOOT_SEED = BOOT_SEED_PTA_UUID;
  TEE_TASessionHandle session{};
  TEE_Result res =
      TEE_OpenTASession(&BOOT_SEED, TEE_TIMEOUT_INFINITE, 0, nullptr, &session, nullptr);
  if (res != TEE_SUCCESS) return res;
  res = read_seed(session, seed, length);
  TEE_CloseTASession(session);
  return res;
}

uint32_t TEE_TraceThreshold() {
  return static_cast<uint32_t>(std::max(trace_get_level(), 0));
}

// OP-TEE puts its own thread number nowhere that a trusted application could read it.
uint32_t TEE_TraceThread() {
  return 0;
}

void TEE_TraceWrite(uint32_t, const char* line, size_t length) {
  char text[MAX_LINE_SIZE + 1] = {};
  std::copy_n(line, std::min(length, MAX_LINE_SIZE), text);
  trace_ext_puts(text);
}
