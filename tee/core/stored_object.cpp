// The content of a persistent object and its form in the store.
#include "tee/core/stored_object.h"

#include <utility>

namespace tee {

namespace {

constexpr uint32_t VERSION = 1;

void append(secret_bytes* out, uint32_t value) {
  for (int shift = 0; shift < 32; shift += 8)
    out->push_back(static_cast<uint8_t>(value >> shift));
}

// Takes a number off the front; false when there is none left.
bool take(std::span<const uint8_t>* rest, uint32_t* value) {
  if (rest->size() < sizeof(uint32_t)) return false;
  *value = 0;
  for (size_t i = sizeof(uint32_t); i-- > 0;)
    *value = *value << 8 | (*rest)[i];
  *rest = rest->subspan(sizeof(uint32_t));
  return true;
}

bool take(std::span<const uint8_t>* rest, crypto::attribute* attribute) {
  if (!take(rest, &attribute->id)) return false;
  if (attribute->is_value()) return take(rest, &attribute->a) && take(rest, &attribute->b);
  uint32_t length = 0;
  if (!take(rest, &length) || length > rest->size()) return false;
  attribute->bytes.assign(rest->begin(), rest->begin() + length);
  *rest = rest->subspan(length);
  return true;
}

// What encode() adds to the data, so that the buffer never moves while it is filled.
size_t overhead_of(const stored_object& object) {
  size_t length = 5 * sizeof(uint32_t);
  for (const crypto::attribute& attribute : object.attributes) {
    length += 3 * sizeof(uint32_t) + attribute.bytes.size();
  }
  return length;
}

}  // namespace

secret_bytes encode(const stored_object& object) {
  secret_bytes out;
  out.reserve(overhead_of(object) + object.data.size());
  append(&out, VERSION);
  append(&out, object.type);
  append(&out, object.max_bits);
  append(&out, object.usage);
  append(&out, static_cast<uint32_t>(object.attributes.size()));
  for (const crypto::attribute& attribute : object.attributes) {
    append(&out, attribute.id);
    if (attribute.is_value()) {
      append(&out, attribute.a);
      append(&out, attribute.b);
    } else {
      append(&out, static_cast<uint32_t>(attribute.bytes.size()));
      out.insert(out.end(), attribute.bytes.begin(), attribute.bytes.end());
    }
  }
  out.insert(out.end(), object.data.begin(), object.data.end());
  return out;
}

std::optional<stored_object> decode(std::span<const uint8_t> bytes) {
  stored_object object;
  uint32_t version = 0;
  uint32_t count = 0;
  if (!take(&bytes, &version) || version != VERSION || !take(&bytes, &object.type) ||
      !take(&bytes, &object.max_bits) || !take(&bytes, &object.usage) || !take(&bytes, &count)) {
    return std::nullopt;
  }
  for (uint32_t i = 0; i < count; i++) {
    crypto::attribute attribute;
    if (!take(&bytes, &attribute)) return std::nullopt;
    object.attributes.push_back(std::move(attribute));
  }
  object.data.assign(bytes.begin(), bytes.end());
  return object;
}

}  // namespace tee
