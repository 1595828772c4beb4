// TEE_GenerateRandom.
#include "tee/crypto/random.h"

#include "tee_internal_api.h"

#include "tee/api/arguments.h"
#include "tee/core/instance.h"

void TEE_GenerateRandom(void* randomBuffer, size_t randomBufferLen) {
  constexpr const char* CALL = "TEE_GenerateRandom";
  tee::guarded(CALL, [&] {
    tee::current_instance(CALL);
    tee::input_bytes(CALL, "randomBuffer", randomBuffer, randomBufferLen);
    tee::require_own_output(CALL, "randomBuffer", randomBuffer, randomBufferLen);
    tee::crypto::fill_random({static_cast<uint8_t*>(randomBuffer), randomBufferLen});
  });
}
