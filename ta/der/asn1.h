// ASN.1 values in memory, and the templates that make records of them. A record type is a table of
// its fields: adding a structure means writing a table, not code.
#pragma once

#include <cstddef>
#include <cstdint>

#include "ta/base/bytes.h"
#include "ta/base/heap.h"
#include "ta/base/trace.h"
#include "ta/der/der.h"

namespace keymaster {

// asn1_type: what a kind of value can do. A value is plain memory; initialise makes it legal for
// the two others, free returns it to a state that initialise could have left.
struct asn1_type {
  void (*initialise)(void* value);
  void (*free)(void* value);
  int32_t (*write)(der_cursor* out, const void* value);
};

// How a field is tagged: the mode in the top two bits, a tag word in the rest.
constexpr uint32_t ASN1_NO_TAG = 0;
// The low byte replaces the identifier octet that the field's writer made.
constexpr uint32_t ASN1_IMPLICIT = 0x40000000;
// The field is wrapped in its length and the tag, which is made constructed.
constexpr uint32_t ASN1_EXPLICIT = 0x80000000;

// asn1_field: one row of a record's template, in encoding order. A field whose presence byte is
// zero is written as `fallback`, or left out when there is none.
struct asn1_field {
  size_t offset = 0;
  uint32_t tag = ASN1_NO_TAG;
  const asn1_type* type = nullptr;
  size_t presence = 0;  // offset of the presence byte, or ASN1_ALWAYS
  const void* fallback = nullptr;
};
constexpr size_t ASN1_ALWAYS = SIZE_MAX;

// asn1_action: initialise or free, whichever is to be done to every part of a value.
using asn1_action = void (*asn1_type::*)(void* value);

// The operations of a SEQUENCE with these fields. The actions also clear every presence byte.
void asn1_sequence_apply(std::span<const asn1_field> fields, asn1_action action, void* record);
[[nodiscard]] int32_t asn1_sequence_write(std::span<const asn1_field> fields, der_cursor* out,
                                          const void* record);

// asn1_sequence<FIELDS>::TYPE: the type of such records, for use as a field of others.
template <const auto& FIELDS>
struct asn1_sequence {
  static void initialise(void* record) {
    asn1_sequence_apply(FIELDS, &asn1_type::initialise, record);
  }
  static void free(void* record) { asn1_sequence_apply(FIELDS, &asn1_type::free, record); }
  static int32_t write(der_cursor* out, const void* record) {
    return asn1_sequence_write(FIELDS, out, record);
  }
  static constexpr asn1_type TYPE = {initialise, free, write};
};

// asn1_alternative: one row of a CHOICE's table. The value starts with its 32-bit selector.
struct asn1_alternative {
  uint32_t selector;
  size_t offset;
  const asn1_type* type;
};
void asn1_choice_apply(std::span<const asn1_alternative> table, asn1_action action, void* value);
// DER_INVALID: no row has the selector.
[[nodiscard]] int32_t asn1_choice_write(std::span<const asn1_alternative> table, der_cursor* out,
                                        const void* value);
template <const auto& TABLE>
struct asn1_choice {
  static void initialise(void* value) { asn1_choice_apply(TABLE, &asn1_type::initialise, value); }
  static void free(void* value) { asn1_choice_apply(TABLE, &asn1_type::free, value); }
  static int32_t write(der_cursor* out, const void* value) {
    return asn1_choice_write(TABLE, out, value);
  }
  static constexpr asn1_type TYPE = {initialise, free, write};
};

// asn1_list: a doubly linked list of heap items, each of which starts with its link. New items go
// in at the head; written backwards from there, they come out in the order in which they were
// added.
struct asn1_link {
  asn1_link* next;
  asn1_link* previous;
};
struct asn1_list {
  asn1_link* head;
};

// asn1_list_of: a list whose items are records of `item_size` bytes with their value at
// `value_offset`, written under `tag` (SET or SEQUENCE).
struct asn1_list_of {
  size_t item_size;
  size_t value_offset;
  const asn1_type* type;
  uint32_t tag;
};
// A new item, initialised and linked in; null, traced as "Out of memory, need %uB", if there is
// none.
[[nodiscard]] void* asn1_list_add(const asn1_list_of& kind, asn1_list* list);
void asn1_list_free(const asn1_list_of& kind, asn1_list* list);
[[nodiscard]] int32_t asn1_list_write(const asn1_list_of& kind, der_cursor* out,
                                      const asn1_list& list);
template <const asn1_list_of& KIND>
struct asn1_list_type {
  static void initialise(void* list) { static_cast<asn1_list*>(list)->head = nullptr; }
  static void free(void* list) { asn1_list_free(KIND, static_cast<asn1_list*>(list)); }
  static int32_t write(der_cursor* out, const void* list) {
    return asn1_list_write(KIND, out, *static_cast<const asn1_list*>(list));
  }
  static constexpr asn1_type TYPE = {initialise, free, write};
};

// asn1_alloc: a record on the heap, initialised; null, traced, when out of memory. asn1_release
// frees its fields and the record; null is ignored.
[[nodiscard]] void* asn1_alloc(const asn1_type& type, size_t size);
void asn1_release(const asn1_type& type, void* record, size_t size);

// asn1_owner: owns a record on the heap; null is legal.
template <class T, void (*FREE)(T*)>
class asn1_owner {
 public:
  explicit asn1_owner(T* record) : record_(record) {}
  asn1_owner(const asn1_owner&) = delete;
  asn1_owner& operator=(const asn1_owner&) = delete;
  ~asn1_owner() { FREE(record_); }

  T* get() const { return record_; }
  T* operator->() const { return record_; }
  explicit operator bool() const { return record_ != nullptr; }

 private:
  T* record_;
};

// asn1_encode: runs a type's writer over the whole buffer and moves the encoding to its start. The
// encoded length, or a negative code.
[[nodiscard]] int32_t asn1_encode(const asn1_type& type, const void* value, byte_span buffer);

// asn1_encode_growing: the same into a heap buffer that starts at `first_size` bytes and is doubled
// while the writer finds it too small. DER_NO_MEMORY, traced, when it cannot grow.
[[nodiscard]] int32_t asn1_encode_growing(const asn1_type& type, const void* value,
                                          size_t first_size, heap_buffer* encoding);

// Values. INTEGER: uint64_t. BOOLEAN: uint8_t. NULL: nothing, its presence is the value.

// ASN1_OCTET_STRING: owned bytes; also UTF8String, and unsigned big-endian INTEGERs beyond 64 bits.
struct ASN1_OCTET_STRING {
  uint8_t* bytes;
  uint32_t length;

  byte_view view() const { return {bytes, length}; }
};
// Replaces the bytes by a copy; 0 or DER_NO_MEMORY.
[[nodiscard]] int32_t ASN1_OCTET_STRING_set(ASN1_OCTET_STRING* string, byte_view bytes);

// ASN1_BIT_STRING: `bits` counts from the most significant bit of the first byte; `size` bytes are
// owned.
struct ASN1_BIT_STRING {
  uint64_t bits;
  uint8_t* bytes;
  uint32_t size;
};
// Replaces the contents by a copy of ceil(bits / 8) bytes.
[[nodiscard]] int32_t ASN1_BIT_STRING_set(ASN1_BIT_STRING* string, uint64_t bits, byte_view bytes);
// Sets or clears bit `index` and makes the string at least index + 1 bits long: clearing a bit
// lengthens it too, which is intended. 0 or DER_NO_MEMORY.
[[nodiscard]] int32_t ASN1_BIT_STRING_set_bit(ASN1_BIT_STRING* string, uint32_t index, bool value);

// ASN1_OID: a segment of an object identifier: the parent chain's arcs, then its own.
struct ASN1_OID {
  const ASN1_OID* parent;
  const uint64_t* arcs;
  uint32_t count;
};
[[nodiscard]] int32_t _ASN1_OID_write(der_cursor* out, const ASN1_OID* oid);

// ASN1_TIME: written with `type` as its tag; the writer never chooses the form by the year.
struct ASN1_TIME {
  uint32_t type;  // DER_UTC_TIME or DER_GENERALIZED_TIME
  uint64_t year;
  uint32_t month;
  uint32_t day;
  uint32_t hour;
  uint32_t minute;
  uint32_t second;
};
// The UTC date of `seconds` since 1970, proleptic Gregorian; any value is handled.
ASN1_TIME ASN1_TIME_from_seconds(uint32_t type, uint64_t seconds);

// An INTEGER that was never set shows.
constexpr uint64_t ASN1_INTEGER_UNSET = 0xDEADBEAF;

extern const asn1_type ASN1_INTEGER_TYPE;
extern const asn1_type ASN1_BIG_INTEGER_TYPE;  // ASN1_OCTET_STRING in memory
extern const asn1_type ASN1_BOOLEAN_TYPE;
extern const asn1_type ASN1_NULL_TYPE;
extern const asn1_type ASN1_OCTET_STRING_TYPE;
extern const asn1_type ASN1_UTF8STRING_TYPE;  // ASN1_OCTET_STRING in memory
extern const asn1_type ASN1_BIT_STRING_TYPE;
extern const asn1_type ASN1_OID_TYPE;  // const ASN1_OID* in memory
extern const asn1_type ASN1_TIME_TYPE;

// NOLINTBEGIN(bugprone-macro-parentheses): the arguments are type names
// Every record type X has X_TYPE, X_alloc (null, traced, when out of memory), X_free and X_write,
// which encodes to the start of a buffer and returns the length or a negative code.
#define KM_DECLARE_ASN1_OPERATIONS(type) \
  [[nodiscard]] type* type##_alloc();    \
  void type##_free(type* record);        \
  [[nodiscard]] int32_t type##_write(const type* record, uint8_t* buffer, size_t size);
#define KM_DECLARE_ASN1_RECORD(type)  \
  extern const asn1_type type##_TYPE; \
  KM_DECLARE_ASN1_OPERATIONS(type)

// The same for a record whose operations are asn1_sequence<...>, asn1_choice<...> or
// asn1_list_type<...>.
#define KM_DEFINE_ASN1_OPERATIONS(type)                                    \
  type* type##_alloc() {                                                   \
    const trace_scope scope;                                               \
    return static_cast<type*>(asn1_alloc(type##_TYPE, sizeof(type)));      \
  }                                                                        \
  void type##_free(type* record) {                                         \
    asn1_release(type##_TYPE, record, sizeof(type));                       \
  }                                                                        \
  int32_t type##_write(const type* record, uint8_t* buffer, size_t size) { \
    return asn1_encode(type##_TYPE, record, {buffer, size});               \
  }
#define KM_DEFINE_ASN1_RECORD(type, operations)   \
  const asn1_type type##_TYPE = operations::TYPE; \
  KM_DEFINE_ASN1_OPERATIONS(type)
// NOLINTEND(bugprone-macro-parentheses)

}  // namespace keymaster
