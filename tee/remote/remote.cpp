// The TEE Client API of a TEE that another process serves.
#include "tee/remote/remote.h"

#include <algorithm>
#include <cstring>
#include <exception>
#include <memory>
#include <mutex>
#include <string>
#include <utility>

#include "tee/remote/remote_call.h"
#include "tee/teec/imp_table.h"

namespace tee::remote {

namespace {

// A context outlives its server: the next session gets the next one.
struct remote_context {
  std::string path;
  std::mutex mutex;
  std::shared_ptr<link> tie;
};

struct remote_session {
  const void* context;  // imp of its context
  std::shared_ptr<link> tie;
  uint32_t number;  // at the server
};

// Never destroyed: programs may end contexts as late as they like.
auto& contexts() {
  static auto& table = *new imp_table<remote_context, way::SERVED>;
  return table;
}
auto& sessions() {
  static auto& table = *new imp_table<remote_session, way::SERVED>;
  return table;
}
auto& memories() {
  static auto& table = *new imp_table<remote_memory, way::SERVED>;
  return table;
}

std::shared_ptr<const shared_region> find_memory(const void* imp) {
  return memories().find(imp);
}

template <typename Body>
TEEC_Result guarded(Body body) noexcept {
  try {
    return body();
  } catch (const std::exception&) {
    return TEEC_ERROR_OUT_OF_MEMORY;
  }
}

// The link of a context; a new one when the server went away.
TEEC_Result link_of(remote_context& context, std::shared_ptr<link>* tie) {
  std::lock_guard lock(context.mutex);
  if (!context.tie->at_home()) return TEEC_ERROR_BAD_STATE;
  if (!context.tie->usable()) {
    if (TEEC_Result res = link::open(context.path, &context.tie)) return res;
  }
  *tie = context.tie;
  return TEEC_SUCCESS;
}

// Asks the server to end what it has under a number; one that is gone has ended it.
void end(link& tie, wire::request kind, uint32_t number) {
  if (!tie.usable()) return;
  wire::answer ignored;
  static_cast<void>(tie.ask(
      [&](wire::writer& to) {
        to.u32(static_cast<uint32_t>(kind));
        to.u32(number);
      },
      &ignored));
}

TEEC_Result initialize_context(const char* name, TEEC_Context* context) {
  return guarded([&]() -> TEEC_Result {
    auto made = std::make_shared<remote_context>();
    made->path = name;
    if (TEEC_Result res = link::open(made->path, &made->tie)) return res;
    context->imp = contexts().add(std::move(made));
    return TEEC_SUCCESS;
  });
}

void finalize_context(TEEC_Context* context) {
  guarded([&]() -> TEEC_Result {
    auto ended = contexts().take(context->imp);
    for (const auto& left : sessions().take_all_of(context->imp))
      end(*left->tie, wire::request::CLOSE, left->number);
    memories().take_all_of(context->imp);  // the server's share ends with the last connection
    context->imp = nullptr;
    return TEEC_SUCCESS;
  });
}

TEEC_Result check(const TEEC_Context* context, const TEEC_SharedMemory* memory) {
  return contexts().find(context->imp) ? check_memory(memory) : TEEC_ERROR_BAD_PARAMETERS;
}

TEEC_Result register_shared_memory(TEEC_Context* context, TEEC_SharedMemory* memory) {
  return guarded([&]() -> TEEC_Result {
    if (TEEC_Result res = check(context, memory)) return res;
    if (memory->buffer == nullptr) return TEEC_ERROR_BAD_PARAMETERS;
    auto kept = std::make_shared<remote_memory>();
    static_cast<shared_region&>(*kept) = {context->imp, static_cast<uint8_t*>(memory->buffer),
                                          memory->size, memory->flags};
    memory->imp = memories().add(std::move(kept));
    return TEEC_SUCCESS;
  });
}

TEEC_Result allocate_shared_memory(TEEC_Context* context, TEEC_SharedMemory* memory) {
  return guarded([&]() -> TEEC_Result {
    if (TEEC_Result res = check(context, memory)) return res;
    auto made = std::make_shared<remote_memory>();
    if (TEEC_Result res = link_of(*contexts().find(context->imp), &made->tie)) return res;
    // At least one byte, so that the buffer is an address even when nothing fits in it.
    made->mapping = wire::shared_mapping::make(std::max<size_t>(memory->size, 1));
    TEEC_Result shared = TEEC_SUCCESS;
    if (!share(*made->tie, made->mapping, &made->number, &shared)) return TEEC_ERROR_COMMUNICATION;
    if (shared != TEEC_SUCCESS) return shared;
    static_cast<shared_region&>(*made) = {context->imp, made->mapping.data(), memory->size,
                                          memory->flags};
    memory->buffer = made->buffer;
    memory->imp = memories().add(std::move(made));
    return TEEC_SUCCESS;
  });
}

void release_shared_memory(TEEC_SharedMemory* memory) {
  guarded([&]() -> TEEC_Result {
    auto kept = memories().take(memory->imp);
    memory->imp = nullptr;
    if (!kept || !kept->tie) return TEEC_SUCCESS;
    end(*kept->tie, wire::request::RELEASE, kept->number);
    memory->buffer = nullptr;
    memory->size = 0;
    return TEEC_SUCCESS;
  });
}

void write_uuid(wire::writer& to, const TEEC_UUID& uuid) {
  to.u32(uuid.timeLow);
  to.u32(static_cast<uint32_t>(uuid.timeMid) | static_cast<uint32_t>(uuid.timeHiAndVersion) << 16);
  to.bytes(uuid.clockSeqAndNode);
}

remote_result open_over(link& tie, const operation_parameters& given, TEEC_Operation* operation,
                        const TEEC_UUID& destination, uint32_t method, const void* data) {
  uint32_t group = 0;
  if (data != nullptr) std::memcpy(&group, data, sizeof(group));
  return run_call(tie, given, operation, [&](wire::writer& to, uint32_t call) {
    to.u32(static_cast<uint32_t>(wire::request::OPEN));
    to.u32(call);
    write_uuid(to, destination);
    to.u32(method);
    to.u32(data != nullptr ? 1 : 0);
    to.u32(group);
  });
}

TEEC_Result open_session(TEEC_Context* context, TEEC_Session* session, const TEEC_UUID* destination,
                         uint32_t method, const void* data, TEEC_Operation* operation,
                         uint32_t* return_origin) {
  uint32_t origin = TEEC_ORIGIN_API;
  const TEEC_Result res = guarded([&]() -> TEEC_Result {
    auto client = contexts().find(context->imp);
    if (session == nullptr || destination == nullptr || !client) return TEEC_ERROR_BAD_PARAMETERS;
    operation_parameters given;
    if (TEEC_Result bad = given.take(context->imp, operation, find_memory)) return bad;
    origin = TEEC_ORIGIN_COMMS;
    std::shared_ptr<link> tie;
    if (TEEC_Result failed = link_of(*client, &tie)) return failed;
    remote_result opened = open_over(*tie, given, operation, *destination, method, data);
    if (opened.origin == TEEC_ORIGIN_COMMS && !tie->usable()) {
      // The server went away unseen before this.
      if (TEEC_Result failed = link_of(*client, &tie)) return failed;
      opened = open_over(*tie, given, operation, *destination, method, data);
    }
    origin = opened.origin;
    if (opened.code == TEEC_SUCCESS) {
      auto made = std::make_shared<remote_session>(
          remote_session{context->imp, std::move(tie), opened.number});
      session->imp = sessions().add(std::move(made));
    }
    return opened.code;
  });
  if (return_origin != nullptr) *return_origin = origin;
  return res;
}

void close_session(TEEC_Session* session) {
  guarded([&]() -> TEEC_Result {
    auto ended = sessions().take(session->imp);
    session->imp = nullptr;
    if (ended) end(*ended->tie, wire::request::CLOSE, ended->number);
    return TEEC_SUCCESS;
  });
}

TEEC_Result invoke_command(TEEC_Session* session, uint32_t command, TEEC_Operation* operation,
                           uint32_t* return_origin) {
  uint32_t origin = TEEC_ORIGIN_API;
  const TEEC_Result res = guarded([&]() -> TEEC_Result {
    auto with = sessions().find(session->imp);
    if (!with) return TEEC_ERROR_BAD_PARAMETERS;
    operation_parameters given;
    if (TEEC_Result bad = given.take(with->context, operation, find_memory)) return bad;
    const remote_result done =
        run_call(*with->tie, given, operation, [&](wire::writer& to, uint32_t call) {
          to.u32(static_cast<uint32_t>(wire::request::INVOKE));
          to.u32(call);
          to.u32(with->number);
          to.u32(command);
        });
    origin = done.origin;
    return done.code;
  });
  if (return_origin != nullptr) *return_origin = origin;
  return res;
}

void request_cancellation(TEEC_Operation* operation) {
  guarded([&]() -> TEEC_Result {
    operation_in_flight::cancel(operation);
    return TEEC_SUCCESS;
  });
}

constexpr client_api SERVED = {
    .initialize_context = initialize_context,
    .finalize_context = finalize_context,
    .register_shared_memory = register_shared_memory,
    .allocate_shared_memory = allocate_shared_memory,
    .release_shared_memory = release_shared_memory,
    .open_session = open_session,
    .close_session = close_session,
    .invoke_command = invoke_command,
    .request_cancellation = request_cancellation,
};

}  // namespace

const client_api& api() {
  return SERVED;
}

}  // namespace tee::remote
