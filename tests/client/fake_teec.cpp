// See fake_teec.h.
#include "fake_teec.h"

#include <algorithm>

namespace fake_teec {

std::vector<request> requests;

namespace {

handler current;

uint32_t type_of(uint32_t types, int slot) {
  return types >> (4 * slot) & 0xf;
}

void put(const answer& reply, uint32_t types, TEEC_Parameter* slots) {
  const uint32_t kind = type_of(types, 0);
  if (kind != TEEC_VALUE_INOUT && kind != TEEC_VALUE_OUTPUT) return;
  slots[0].value = {static_cast<uint32_t>(reply.a), reply.b};
  if (type_of(types, 2) != TEEC_MEMREF_TEMP_OUTPUT) return;
  size_t room = std::min(slots[2].tmpref.size, reply.output.size());
  std::copy_n(reply.output.begin(), room, static_cast<uint8_t*>(slots[2].tmpref.buffer));
  slots[2].tmpref.size = reply.output_size == SIZE_MAX ? reply.output.size() : reply.output_size;
}

}  // namespace

void set_handler(handler answers) {
  requests.clear();
  current = std::move(answers);
}

void answer_with(const answer& reply) {
  set_handler([reply](const request&) { return reply; });
}

}  // namespace fake_teec

using fake_teec::current;

TEEC_Result TEEC_InitializeContext(const char*, TEEC_Context*) {
  return TEEC_SUCCESS;
}

void TEEC_FinalizeContext(TEEC_Context*) {}

TEEC_Result TEEC_OpenSession(TEEC_Context*, TEEC_Session*, const TEEC_UUID*, uint32_t, const void*,
                             TEEC_Operation*, uint32_t*) {
  return TEEC_SUCCESS;
}

void TEEC_CloseSession(TEEC_Session*) {}

TEEC_Result TEEC_InvokeCommand(TEEC_Session*, uint32_t command, TEEC_Operation* operation,
                               uint32_t* origin) {
  const uint32_t types = operation->paramTypes;
  fake_teec::request seen{command, types};
  if (fake_teec::type_of(types, 0) == TEEC_VALUE_INOUT) seen.a = operation->params[0].value.a;
  if (fake_teec::type_of(types, 2) != 0) seen.capacity = operation->params[2].tmpref.size;
  fake_teec::requests.push_back(seen);
  fake_teec::answer reply = current(seen);
  *origin = reply.leave_slots ? TEEC_ORIGIN_TEE : TEEC_ORIGIN_TRUSTED_APP;
  if (!reply.leave_slots) fake_teec::put(reply, types, operation->params);
  return reply.result;
}
