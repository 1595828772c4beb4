// TEE Internal Core API: panics.
#include "tee/core/panic.h"

#include "tee_internal_api.h"

void TEE_Panic(TEE_Result panicCode) {
  tee::panic("TEE_Panic", "code 0x%08x", panicCode);
}
