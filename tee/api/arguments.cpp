// Checked arguments of API calls.
#include "tee/api/arguments.h"

#include <algorithm>

#include "tee/core/instance.h"
#include "tee/core/profile.h"

namespace tee {
namespace {

bool overlap(std::span<const uint8_t> a, const uint8_t* b, size_t b_length) {
  auto a_begin = reinterpret_cast<uintptr_t>(a.data());
  auto b_begin = reinterpret_cast<uintptr_t>(b);
  return a_begin < b_begin + b_length && b_begin < a_begin + a.size();
}

}  // namespace

TEE_Result output_buffer::fill(std::span<const uint8_t> bytes) {
  if (TEE_Result res = reserve(bytes.size())) return res;
  std::copy(bytes.begin(), bytes.end(), data_);
  set_length(bytes.size());
  return TEE_SUCCESS;
}

void require_own(const char* call, const char* name, const void* data, size_t length) {
  if (current_instance(call).holds_of_client(data, length)) {
    panic(call, "%s is in memory of the client", name);
  }
}

void require_own_output(const char* call, const char* name, const void* data, size_t length) {
  if (current_profile().strict) require_own(call, name, data, length);
}

void require_apart(const char* call, std::span<const uint8_t> input, const uint8_t* output,
                   size_t output_length, same_place rule) {
  if (!current_profile().strict || input.empty() || output_length == 0) return;
  if (!overlap(input, output, output_length)) return;
  if (rule == same_place::ALLOWED && input.data() == output) return;
  panic(call, "input and output share memory");
}

steady_input::steady_input(std::span<const uint8_t> input, const uint8_t* output,
                           size_t output_length, bool same_place_is_safe)
    : bytes_(input) {
  if (!overlap(input, output, output_length)) return;
  if (same_place_is_safe && input.data() == output) return;
  copy_.assign(input.begin(), input.end());
  bytes_ = copy_;
}

}  // namespace tee
