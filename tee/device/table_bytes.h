// Little-endian records, as the device's own files hold them.
#pragma once

#include "tee_internal_api.h"

#include <algorithm>
#include <cstdint>
#include <optional>
#include <span>
#include <vector>

#include "tee/device/object_name.h"

namespace tee {

template <typename Bytes, typename T>
void append_number(Bytes* out, T value) {
  for (size_t i = 0; i < sizeof(T); i++)
    out->push_back(static_cast<uint8_t>(value >> (8 * i)));
}

// Reads such a record; a failed read gives nothing and reads no further.
class table_reader {
 public:
  explicit table_reader(std::span<const uint8_t> bytes) : rest_(bytes) {}

  std::optional<std::span<const uint8_t>> bytes(size_t length) {
    if (length > rest_.size()) return std::nullopt;
    auto taken = rest_.first(length);
    rest_ = rest_.subspan(length);
    return taken;
  }

  template <typename T>
  std::optional<T> number() {
    auto taken = bytes(sizeof(T));
    if (!taken) return std::nullopt;
    T value = 0;
    for (size_t i = sizeof(T); i-- > 0;)
      value = static_cast<T>(value << 8 | (*taken)[i]);
    return value;
  }

  // A TA and an object id with its length.
  std::optional<object_name> name(uint32_t storage) {
    auto ta = bytes(sizeof(uuid_bytes));
    auto length = number<uint8_t>();
    if (!ta || !length || *length > TEE_OBJECT_ID_MAX_LEN) return std::nullopt;
    auto id = bytes(*length);
    if (!id) return std::nullopt;
    object_name read{storage, {}, {id->begin(), id->end()}};
    std::copy(ta->begin(), ta->end(), read.ta.begin());
    return read;
  }

  bool done() const { return rest_.empty(); }

 private:
  std::span<const uint8_t> rest_;
};

}  // namespace tee
