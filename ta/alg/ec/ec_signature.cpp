// DER of ECDSA signatures.
#include "ta/alg/ec/ec_signature.h"

#include <algorithm>

#include "ta/alg/big_endian.h"
#include "ta/base/outcome.h"

namespace keymaster {
namespace {

constexpr uint8_t TAG_INTEGER = 0x02;
constexpr uint8_t TAG_SEQUENCE = 0x30;
constexpr uint8_t LONG_FORM = 0x80;
constexpr uint8_t SIGN_BIT = 0x80;
constexpr uint32_t MAX_SHORT_LENGTH = 126;
constexpr uint32_t MAX_LENGTH_BYTES = 4;

uint32_t length_of_length(uint32_t length) {
  if (length <= 254) return 1;
  if (length <= 65534) return 2;
  return length <= 16777214 ? 3 : 4;
}

// The size of a value with its tag and length: the short form below 128, unlike encode_length.
uint32_t encoded_size(uint32_t content) {
  const uint32_t long_form = length_of_length(content);
  const uint32_t length = long_form == 1 && content < 128 ? 1 : long_form + 1;
  return 1 + length + content;
}

bool write_byte(output_cursor* out, uint8_t byte) {
  return out->write_bytes({&byte, 1});
}

// A number as an INTEGER's content: its significant bytes, behind a 0 if they would read as a
// negative number.
struct integer_t {
  explicit integer_t(byte_view number)
      : digits(without_leading_zeros(number)),
        is_prefixed(!digits.empty() && (digits.front() & SIGN_BIT) != 0) {}

  uint32_t content() const { return static_cast<uint32_t>(digits.size() + (is_prefixed ? 1 : 0)); }
  bool write(output_cursor* out) const {
    return write_byte(out, TAG_INTEGER) && encode_length(out, content()) &&
           (!is_prefixed || write_byte(out, 0)) && out->write_bytes(digits);
  }

  byte_view digits;
  bool is_prefixed;
};

bool read_byte(input_cursor* in, uint8_t* byte) {
  return in->read_into({byte, 1});
}

// Non-minimal forms pass; the comparison with the encoder's form refuses them.
bool decode_length(input_cursor* in, uint32_t* length) {
  uint8_t first = 0;
  if (!read_byte(in, &first)) return false;
  *length = first;
  if (first < LONG_FORM) return true;
  const uint32_t count = first & ~LONG_FORM;
  if (count > MAX_LENGTH_BYTES) return false;
  *length = 0;
  for (uint32_t i = 0; i < count; i++) {
    uint8_t byte = 0;
    if (!read_byte(in, &byte)) return false;
    *length = *length << 8 | byte;
  }
  return true;
}

TEE_Result read_header(input_cursor* in, uint8_t tag, uint32_t* length) {
  uint8_t found = 0;
  const bool is_there = read_byte(in, &found);
  if (!is_there || found != tag) {
    return fail(TEE_ERROR_GENERIC, "Wrong tag, expect 0x%02x, got 0x%02x", tag, found);
  }
  return decode_length(in, length) ? TEE_SUCCESS : fail(TEE_ERROR_GENERIC, "Decode length failed");
}

// Reads one INTEGER into `number`, right-aligned; `name` is R or S.
TEE_Result read_integer(input_cursor* in, byte_span number, char name) {
  uint32_t length = 0;
  TRY(read_header(in, TAG_INTEGER, &length));
  byte_view content;
  if (!in->read_bytes(length, &content)) {
    return fail(TEE_ERROR_GENERIC, "Wrong length of integer, %dB available, got %dB",
                static_cast<int>(in->left()), static_cast<int>(length));
  }
  if (!content.empty() && content.front() == 0) content = content.subspan(1);
  if (content.size() > number.size()) {
    return fail(TEE_ERROR_GENERIC, "Wrong length of %c, expect max %dB, got %dB", name,
                static_cast<int>(number.size()), static_cast<int>(content.size()));
  }
  copy_bytes(number, content);
  right_align(number, content.size());
  return TEE_SUCCESS;
}

// Only the encoder's own form is accepted: no trailing bytes, no longer forms than need be.
TEE_Result check_canonical(byte_view der, byte_view r, byte_view s) {
  heap_buffer encoded;
  TRY(der_encode_ec_signature(r, s, &encoded));
  if (encoded.size() != der.size()) return fail(TEE_ERROR_GENERIC, "Encoding size mismatch");
  const bool is_same = std::ranges::equal(encoded.view(), der);
  return is_same ? TEE_SUCCESS : fail(TEE_ERROR_GENERIC, "Encoding mismatch");
}

}  // namespace

bool encode_length(output_cursor* out, uint32_t length) {
  const uint32_t count = length_of_length(length);
  if (count == 1 && length <= MAX_SHORT_LENGTH) {
    return write_byte(out, static_cast<uint8_t>(length));
  }
  if (!write_byte(out, static_cast<uint8_t>(LONG_FORM | count))) return false;
  for (uint32_t i = count; i-- > 0;) {
    if (!write_byte(out, static_cast<uint8_t>(length >> (8 * i)))) return false;
  }
  return true;
}

TEE_Result der_encode_ec_signature(byte_view r, byte_view s, heap_buffer* signature) {
  const trace_scope scope;
  const integer_t first(r);
  const integer_t second(s);
  const uint32_t content = encoded_size(first.content()) + encoded_size(second.content());
  heap_buffer encoded;
  if (!encoded.allocate(encoded_size(content))) {
    return fail(TEE_ERROR_OUT_OF_MEMORY, "Out of memory");
  }
  output_cursor out(encoded.span());
  const bool written = write_byte(&out, TAG_SEQUENCE) && encode_length(&out, content) &&
                       first.write(&out) && second.write(&out);
  if (!written || out.left() != 0) {
    return fail(TEE_ERROR_GENERIC, "Unfilled buffer, size calculation error");
  }
  *signature = std::move(encoded);
  return TEE_SUCCESS;
}

TEE_Result der_decode_ec_signature(byte_view der, byte_span r, byte_span s) {
  const trace_scope scope;
  if (der.size() < 2) return fail(TEE_ERROR_GENERIC, "Wrong der length");
  input_cursor in(der);
  uint32_t content = 0;
  TRY(read_header(&in, TAG_SEQUENCE, &content));
  if (content != in.left()) {
    const uint64_t expected = uint64_t{der.size() - in.left()} + content;
    return fail(TEE_ERROR_GENERIC, "Wrong length of sequence, expect %dB, got %dB",
                static_cast<int>(expected), static_cast<int>(der.size()));
  }
  TRY(read_integer(&in, r, 'R'));
  TRY(read_integer(&in, s, 'S'));
  return check_canonical(der, r, s);
}

}  // namespace keymaster
