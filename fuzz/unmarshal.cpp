// Any bytes as a marshalled parameter set. What is accepted encodes back to the bytes that were
// read, with zeros where a blob's value field carried anything; what is refused leaves an empty
// set; and the heap is empty afterwards.
#include <algorithm>
#include <cstdlib>
#include <vector>

#include "platform.h"
#include "ta/params/dump.h"
#include "ta/params/marshal.h"

using namespace keymaster;

namespace {

void require(bool holds) {
  if (!holds) std::abort();
}

std::vector<uint8_t> marshalled(const keymaster_key_param_set_t& set) {
  uint8_t* buffer = nullptr;
  uint32_t size = 0;
  require(marshal(set, true, &buffer, &size) == TEE_SUCCESS);
  require(size == marshal_size(set, true) && marshal_size(set, false) <= size);
  std::vector<uint8_t> result(buffer, buffer + size);
  heap_give_back(buffer, size);
  return result;
}

// Walks what was accepted, entry by entry, apart from the code under test.
void clear_blob_values(std::vector<uint8_t>* bytes) {
  const auto number = [&](size_t at) {
    uint32_t value = 0;
    for (size_t i = 4; i-- > 0;)
      value = value << 8 | (*bytes)[at + i];
    return value;
  };
  for (size_t at = 4; at < bytes->size();) {
    const bool blob = has_blob(number(at));
    const size_t next = at + 24 + (blob ? number(at + 16) : 0);
    if (blob) std::fill_n(bytes->begin() + static_cast<std::ptrdiff_t>(at) + 8, 8, uint8_t{0});
    at = next;
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  platform::reset();
  {
    keymaster_key_param_set_t set;
    if (unmarshal({data, size}, &set) == TEE_SUCCESS) {
      KEYMASTER_DUMP_KEY_PARAM_SET(set);
      const std::vector<uint8_t> back = marshalled(set);
      require(back.size() <= size);
      std::vector<uint8_t> read(data, data + back.size());
      clear_blob_values(&read);
      require(back == read);
    } else {
      require(set.params == nullptr && set.length == 0);
    }
  }
  require(platform::live_blocks == 0 && platform::unwiped_blocks == 0);
  return 0;
}
