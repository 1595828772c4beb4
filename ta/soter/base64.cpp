// Base64 text in the lines of PEM.
#include "ta/soter/base64.h"

#include <algorithm>

namespace keymaster {
namespace {

constexpr char ALPHABET[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";

constexpr size_t GROUP = 3;        // bytes that four characters stand for
constexpr size_t LINE_BYTES = 48;  // of which 64 characters stand for

uint64_t text_size(uint64_t data_size) {
  const uint64_t groups = (data_size + GROUP - 1) / GROUP;
  const uint64_t breaks = data_size == 0 ? 0 : (data_size - 1) / LINE_BYTES;
  return 4 * groups + breaks;
}

// Writes the four characters of one to three bytes.
bool write_group(output_cursor* out, byte_view bytes) {
  uint32_t bits = 0;
  for (size_t i = 0; i < GROUP; i++)
    bits = bits << 8 | (i < bytes.size() ? bytes[i] : 0);
  uint8_t characters[4];
  for (size_t i = 0; i < 4; i++) {
    const bool padding = i > bytes.size();
    characters[i] = static_cast<uint8_t>(padding ? '=' : ALPHABET[bits >> (18 - 6 * i) & 63]);
  }
  return out->write_bytes(characters);
}

}  // namespace

bool base64_encode(byte_view data, heap_buffer* text) {
  text->reset();
  const uint64_t size = text_size(data.size());
  heap_buffer made;
  if (size > UINT32_MAX || !made.allocate(static_cast<size_t>(size))) return false;
  output_cursor out(made.span());
  constexpr uint8_t BREAK[] = {'\n'};
  for (size_t at = 0; at < data.size(); at += GROUP) {
    if (at > 0 && at % LINE_BYTES == 0 && !out.write_bytes(BREAK)) return false;
    if (!write_group(&out, data.subspan(at, std::min(GROUP, data.size() - at)))) return false;
  }
  *text = std::move(made);
  return true;
}

}  // namespace keymaster
