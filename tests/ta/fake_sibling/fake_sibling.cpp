// A sibling that does as it is told.
#include "fake_sibling.h"

#include "tee_internal_api.h"

#include <cstring>

#include "product/uuids.h"

namespace {

struct stored_answer {
  fake_answer how;
  size_t size;
  uint8_t content[9000];
};
stored_answer answers[4];

stored_answer* answer_to(uint32_t question) {
  for (stored_answer& answer : answers) {
    if (answer.how.question == question) return &answer;
  }
  return nullptr;
}

TEE_Result program(const TEE_Param& slot) {
  fake_answer how;
  memcpy(&how, slot.memref.buffer, sizeof(how));
  stored_answer* answer = answer_to(how.question);
  if (answer == nullptr) answer = answer_to(0);  // a free one: there are three questions
  answer->how = how;
  answer->size = slot.memref.size - sizeof(how);
  memcpy(answer->content, static_cast<const uint8_t*>(slot.memref.buffer) + sizeof(how),
         answer->size);
  return TEE_SUCCESS;
}

TEE_Result forward(const TEE_Param& slot) {
  constexpr TEE_UUID KEYMASTER = KEYMASTER_TA_UUID;
  TEE_TASessionHandle session{};
  TEE_Result res = TEE_OpenTASession(&KEYMASTER, 0, 0, nullptr, &session, nullptr);
  if (res != TEE_SUCCESS) return res;
  TEE_Param params[4] = {};
  params[1] = slot;
  res = TEE_InvokeTACommand(session, 0, 0xFF04, 0x50, params, nullptr);
  TEE_CloseTASession(session);
  return res;
}

// Writes what fits and reports the whole length, and more if so told.
TEE_Result retrieve(uint32_t question, TEE_Param* output, uint32_t* reported) {
  stored_answer* answer = answer_to(question);
  if (answer == nullptr) return TEE_ERROR_ITEM_NOT_FOUND;
  if (answer->how.times > 0) {
    answer->how.times--;
    return answer->how.result;
  }
  const size_t room = output->memref.size;
  memcpy(output->memref.buffer, answer->content, answer->size < room ? answer->size : room);
  *reported = static_cast<uint32_t>(answer->size) + answer->how.claims;
  return TEE_SUCCESS;
}

}  // namespace

TEE_Result TA_InvokeCommandEntryPoint(void*, uint32_t command, uint32_t types, TEE_Param* params) {
  if (command == FAKE_PROGRAM) return program(params[0]);
  if (command == FAKE_FORWARD) return forward(params[0]);
  uint32_t reported = 0;
  if (command == 12 && types == 0x65 && params[0].memref.size == 4) {
    uint32_t question = 0;
    memcpy(&question, params[0].memref.buffer, sizeof(question));
    const TEE_Result res = retrieve(question, &params[1], &reported);
    if (res == TEE_SUCCESS) params[1].memref.size = reported;
    return res;
  }
  if (types != 0x26) return TEE_ERROR_BAD_PARAMETERS;
  const TEE_Result res = retrieve(command, &params[0], &reported);
  if (res == TEE_SUCCESS) params[1].value.a = reported;
  return res;
}
