// A trusted application that fails on demand.
#include "tests/tee/ta_faulty/faulty_ta.h"

#ifndef FAULTY_RULES
#define FAULTY_RULES ""
#endif

namespace {

uint32_t asked = 0;
volatile uint32_t zero = 0;
volatile uint32_t sink = 0;

TEE_Result hold() {
  TEE_ObjectHandle object;
  TEE_OperationHandle operation;
  TEE_TASessionHandle session;
  TEE_Malloc(100, 0);
  TEE_AllocateTransientObject(TEE_TYPE_AES, 128, &object);
  TEE_AllocateOperation(&operation, TEE_ALG_AES_CTR, TEE_MODE_ENCRYPT, 128);
  return TEE_OpenTASession(&faulty::OTHER, TEE_TIMEOUT_INFINITE, 0, nullptr, &session, nullptr);
}

// The page at 0 is nobody's; neither is the one behind it, and its addresses pass the sanitizers.
__attribute__((no_sanitize("undefined"))) void access_null() {
  *reinterpret_cast<volatile uint32_t*>(uintptr_t{zero} + 8) = 1;
}

__attribute__((no_sanitize("undefined"))) uint32_t divide() {
  return sink / zero;
}

__attribute__((noinline)) uint32_t recurse(uint32_t depth, bool calling) {
  volatile uint8_t frame[512];
  frame[depth % sizeof(frame)] = 1;
  if (zero != 0) return 0;  // never
  if (calling) TEE_Free(TEE_Malloc(16, 0));
  const uint32_t below = recurse(depth + 1, calling);
  return below + frame[depth % sizeof(frame)];
}

TEE_Result loop(bool calling) {
  TEE_Time now;
  for (;;) {
    sink = sink + 1;
    if (calling) TEE_GetSystemTime(&now);
  }
}

TEE_Result poll() {
  TEE_UnmaskCancellation();
  while (!TEE_GetCancellationFlag())
    TEE_Wait(1);
  return TEE_ERROR_CANCEL;
}

TEE_Result call_other(uint32_t command) {
  TEE_TASessionHandle session;
  TEE_Param params[4] = {};
  TEE_Result res =
      TEE_OpenTASession(&faulty::OTHER, TEE_TIMEOUT_INFINITE, 0, nullptr, &session, nullptr);
  if (res != TEE_SUCCESS) return res;
  params[0].value = {0, 60'000};
  uint32_t types = TEE_PARAM_TYPES(TEE_PARAM_TYPE_VALUE_INPUT, 0, 0, 0);
  res = TEE_InvokeTACommand(session, 20, command, types, params, nullptr);
  TEE_CloseTASession(session);
  return res;
}

TEE_Result act(uint32_t command, TEE_Param& slot, void** context) {
  switch (command) {
    case faulty::COUNT:
      slot.value.a = ++asked;
      return TEE_SUCCESS;
    case faulty::HOLD:
      return hold();
    case faulty::PANIC:
      TEE_Panic(slot.value.b);
    case faulty::STALE:
      TEE_Free(&asked);
      return TEE_SUCCESS;
    case faulty::NULL_ACCESS:
      access_null();
      return TEE_SUCCESS;
    case faulty::DIVIDE:
      return divide();
    case faulty::RECURSE:
    case faulty::RECURSE_CALLING:
      return recurse(0, command == faulty::RECURSE_CALLING);
    case faulty::LOOP:
    case faulty::LOOP_CALLING:
      return loop(command == faulty::LOOP_CALLING);
    case faulty::WAIT:
      TEE_UnmaskCancellation();
      return TEE_Wait(slot.value.b);
    case faulty::WAIT_MASKED:
      return TEE_Wait(slot.value.b);
    case faulty::POLL:
      return poll();
    case faulty::CALL_OTHER:
      return call_other(slot.value.b);
    case faulty::PANIC_AT_CLOSE:
      *context = &asked;
      return TEE_SUCCESS;
    default:
      return TEE_ERROR_NOT_SUPPORTED;
  }
}

}  // namespace

extern "C" TA_EXPORT const char TA_Properties[] = "gpd.ta.version=1.0\n" FAULTY_RULES;

TEE_Result TA_CreateEntryPoint() {
  return TEE_SUCCESS;
}

void TA_DestroyEntryPoint() {}

TEE_Result TA_OpenSessionEntryPoint(uint32_t types, TEE_Param* params, void** context) {
  *context = nullptr;
  if (TEE_PARAM_TYPE_GET(types, 0) != TEE_PARAM_TYPE_VALUE_INPUT) return TEE_SUCCESS;
  return act(params[0].value.a, params[0], context);
}

void TA_CloseSessionEntryPoint(void* context) {
  if (context != nullptr) TEE_Panic(0);
}

TEE_Result TA_InvokeCommandEntryPoint(void* context, uint32_t command, uint32_t,
                                      TEE_Param* params) {
  return act(command, params[0], &context);
}
