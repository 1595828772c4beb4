// The simple values: how each lies in memory, is initialised, freed and written.
#include <array>

#include "ta/base/trace.h"
#include "ta/der/asn1.h"

namespace keymaster {
namespace {

constexpr uint32_t SECONDS_PER_DAY = 86400;

template <class T>
const T& as(const void* value) {
  return *static_cast<const T*>(value);
}

void do_nothing(void*) {}

template <class T>
void clear(void* value) {
  *static_cast<T*>(value) = {};
}

void initialise_integer(void* value) {
  *static_cast<uint64_t*>(value) = ASN1_INTEGER_UNSET;
}

int32_t write_integer(der_cursor* out, const void* value) {
  return der_write_integer(out, as<uint64_t>(value));
}

int32_t write_boolean(der_cursor* out, const void* value) {
  return der_write_boolean(out, as<uint8_t>(value) != 0);
}

int32_t write_null(der_cursor* out, const void*) {
  return der_write_null(out);
}

void free_string(void* value) {
  auto* string = static_cast<ASN1_OCTET_STRING*>(value);
  heap_give_back(string->bytes, string->length);
  *string = {};
}

template <int32_t (*WRITE)(der_cursor*, byte_view)>
int32_t write_string(der_cursor* out, const void* value) {
  return WRITE(out, as<ASN1_OCTET_STRING>(value).view());
}

void free_bit_string(void* value) {
  auto* string = static_cast<ASN1_BIT_STRING*>(value);
  heap_give_back(string->bytes, string->size);
  *string = {};
}

int32_t write_bit_string(der_cursor* out, const void* value) {
  const auto& string = as<ASN1_BIT_STRING>(value);
  return der_write_bit_string(out, {string.bytes, string.size}, string.bits);
}

int32_t write_oid(der_cursor* out, const void* value) {
  return _ASN1_OID_write(out, as<const ASN1_OID*>(value));
}

// The last `digits` decimal digits of `value`, at `*text`, which moves past them.
void print_digits(uint8_t** text, uint64_t value, int digits) {
  for (int i = digits; i > 0; i--) {
    (*text)[i - 1] = static_cast<uint8_t>('0' + value % 10);
    value /= 10;
  }
  *text += digits;
}

int32_t write_time(der_cursor* out, const void* value) {
  const auto& time = as<ASN1_TIME>(value);
  std::array<uint8_t, 15> text{};
  uint8_t* next = text.data();
  print_digits(&next, time.year, time.type == DER_GENERALIZED_TIME ? 4 : 2);
  for (const uint32_t part :
       {time.month % 13, time.day, time.hour % 24, time.minute % 60, time.second % 60}) {
    print_digits(&next, part, 2);
  }
  *next++ = 'Z';
  const byte_view printed(text.data(), static_cast<size_t>(next - text.data()));
  return der_wrap(out, time.type, der_write_bytes(out, printed));
}

// A buffer of `size` bytes that starts with the old one's; the old one is freed.
bool grow(ASN1_BIT_STRING* string, uint32_t size) {
  void* grown = heap_grow(string->bytes, string->size, size);
  if (grown == nullptr) return false;
  string->bytes = static_cast<uint8_t*>(grown);
  string->size = size;
  return true;
}

}  // namespace

int32_t ASN1_OCTET_STRING_set(ASN1_OCTET_STRING* string, byte_view bytes) {
  heap_buffer copy;
  if (!copy.copy_of(bytes)) return DER_NO_MEMORY;
  free_string(string);
  string->length = static_cast<uint32_t>(bytes.size());
  string->bytes = copy.release();
  return 0;
}

int32_t ASN1_BIT_STRING_set(ASN1_BIT_STRING* string, uint64_t bits, byte_view bytes) {
  const size_t size = static_cast<size_t>((bits + 7) / 8);
  if (size > bytes.size()) return DER_INVALID;
  heap_buffer copy;
  if (!copy.copy_of(bytes.first(size))) return DER_NO_MEMORY;
  free_bit_string(string);
  *string = {bits, copy.release(), static_cast<uint32_t>(size)};
  return 0;
}

int32_t ASN1_BIT_STRING_set_bit(ASN1_BIT_STRING* string, uint32_t index, bool value) {
  const uint32_t size = index / 8 + 1;
  if (string->size < size && !grow(string, size)) return DER_NO_MEMORY;
  const uint8_t mask = static_cast<uint8_t>(0x80 >> (index % 8));
  uint8_t& octet = string->bytes[index / 8];
  octet = static_cast<uint8_t>(value ? octet | mask : octet & ~mask);
  if (string->bits < uint64_t{index} + 1) string->bits = uint64_t{index} + 1;
  return 0;
}

int32_t _ASN1_OID_write(der_cursor* out, const ASN1_OID* oid) {
  const trace_scope scope;
  size_t count = 0;
  for (const ASN1_OID* segment = oid; segment != nullptr; segment = segment->parent) {
    count += segment->count;
  }
  heap_buffer gathered;
  if (!gathered.allocate(count * sizeof(uint64_t))) {
    trace(TEE_TRACE_ERROR, "Out of memory, need %uB",
          static_cast<unsigned>(count * sizeof(uint64_t)));
    return DER_NO_MEMORY;
  }
  auto* arcs = reinterpret_cast<uint64_t*>(gathered.data());
  size_t next = count;
  for (const ASN1_OID* segment = oid; segment != nullptr; segment = segment->parent) {
    for (size_t i = segment->count; i > 0; i--)
      arcs[--next] = segment->arcs[i - 1];
  }
  return der_write_oid(out, {arcs, count});
}

ASN1_TIME ASN1_TIME_from_seconds(uint32_t type, uint64_t seconds) {
  // Years start in March here, so that the leap day comes last; eras of 400 years repeat. 719468 is
  // the number of days from 0000-03-01 to 1970-01-01.
  const uint64_t days = seconds / SECONDS_PER_DAY + 719468;
  const uint64_t era = days / 146097;
  const uint32_t day_of_era = static_cast<uint32_t>(days % 146097);
  const uint32_t year_of_era =
      (day_of_era - day_of_era / 1460 + day_of_era / 36524 - day_of_era / 146096) / 365;
  const uint32_t day_of_year =
      day_of_era - (365 * year_of_era + year_of_era / 4 - year_of_era / 100);
  const uint32_t march_month = (5 * day_of_year + 2) / 153;
  const uint32_t month = march_month < 10 ? march_month + 3 : march_month - 9;
  const uint32_t second_of_day = static_cast<uint32_t>(seconds % SECONDS_PER_DAY);
  return {
      .type = type,
      .year = era * 400 + year_of_era + (month <= 2 ? 1 : 0),
      .month = month,
      .day = day_of_year - (153 * march_month + 2) / 5 + 1,
      .hour = second_of_day / 3600,
      .minute = second_of_day / 60 % 60,
      .second = second_of_day % 60,
  };
}

const asn1_type ASN1_INTEGER_TYPE = {initialise_integer, do_nothing, write_integer};
const asn1_type ASN1_BIG_INTEGER_TYPE = {clear<ASN1_OCTET_STRING>, free_string,
                                         write_string<der_write_integer>};
const asn1_type ASN1_BOOLEAN_TYPE = {clear<uint8_t>, do_nothing, write_boolean};
const asn1_type ASN1_NULL_TYPE = {do_nothing, do_nothing, write_null};
const asn1_type ASN1_OCTET_STRING_TYPE = {clear<ASN1_OCTET_STRING>, free_string,
                                          write_string<der_write_octet_string>};
const asn1_type ASN1_UTF8STRING_TYPE = {clear<ASN1_OCTET_STRING>, free_string,
                                        write_string<der_write_utf8_string>};
const asn1_type ASN1_BIT_STRING_TYPE = {clear<ASN1_BIT_STRING>, free_bit_string, write_bit_string};
const asn1_type ASN1_OID_TYPE = {clear<const ASN1_OID*>, do_nothing, write_oid};
const asn1_type ASN1_TIME_TYPE = {clear<ASN1_TIME>, do_nothing, write_time};

}  // namespace keymaster
