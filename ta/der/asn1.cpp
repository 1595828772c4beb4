// Records, choices and lists: the constructed values.
#include "ta/der/asn1.h"

#include "ta/base/trace.h"

namespace keymaster {
namespace {

constexpr uint32_t MODE_MASK = 0xC0000000;

void* member(void* record, size_t offset) {
  return static_cast<uint8_t*>(record) + offset;
}

const void* member(const void* record, size_t offset) {
  return static_cast<const uint8_t*>(record) + offset;
}

// Zeroed memory, traced when there is none.
void* take(size_t size) {
  void* block = heap_take(size);
  if (block == nullptr) {
    trace(TEE_TRACE_ERROR, "Out of memory, need %uB", static_cast<unsigned>(size));
  }
  return block;
}

// What stands for the field in the encoding; null when it is left out.
const void* chosen_value(const asn1_field& field, const void* record) {
  if (field.presence == ASN1_ALWAYS ||
      *static_cast<const uint8_t*>(member(record, field.presence)) != 0) {
    return member(record, field.offset);
  }
  return field.fallback;
}

int32_t apply_tag(uint32_t tag, der_cursor* out, int32_t written) {
  switch (tag & MODE_MASK) {
    case ASN1_NO_TAG:
      return written;
    case ASN1_IMPLICIT:
      out->written()[0] = static_cast<uint8_t>(tag);
      return written;
    case ASN1_EXPLICIT:
      return der_wrap(out, (tag & ~MODE_MASK) | DER_CONSTRUCTED, written);
    default:
      return DER_INVALID;
  }
}

int32_t write_field(const asn1_field& field, der_cursor* out, const void* record) {
  const void* value = chosen_value(field, record);
  if (value == nullptr) return 0;
  const int32_t written = field.type->write(out, value);
  return written < 0 ? written : apply_tag(field.tag, out, written);
}

}  // namespace

void asn1_sequence_apply(std::span<const asn1_field> fields, asn1_action action, void* record) {
  for (const asn1_field& field : fields) {
    (field.type->*action)(member(record, field.offset));
    if (field.presence != ASN1_ALWAYS) *static_cast<uint8_t*>(member(record, field.presence)) = 0;
  }
}

int32_t asn1_sequence_write(std::span<const asn1_field> fields, der_cursor* out,
                            const void* record) {
  int32_t total = 0;
  for (size_t i = fields.size(); i > 0; i--) {
    const int32_t written = write_field(fields[i - 1], out, record);
    if (written < 0) return written;
    total += written;
  }
  return der_wrap(out, DER_SEQUENCE, total);
}

void asn1_choice_apply(std::span<const asn1_alternative> table, asn1_action action, void* value) {
  *static_cast<uint32_t*>(value) = 0;
  for (const asn1_alternative& row : table)
    (row.type->*action)(member(value, row.offset));
}

int32_t asn1_choice_write(std::span<const asn1_alternative> table, der_cursor* out,
                          const void* value) {
  const uint32_t selector = *static_cast<const uint32_t*>(value);
  for (const asn1_alternative& row : table) {
    if (row.selector == selector) return row.type->write(out, member(value, row.offset));
  }
  return DER_INVALID;
}

void* asn1_list_add(const asn1_list_of& kind, asn1_list* list) {
  auto* item = static_cast<asn1_link*>(take(kind.item_size));
  if (item == nullptr) return nullptr;
  kind.type->initialise(member(item, kind.value_offset));
  item->next = list->head;
  item->previous = nullptr;
  if (list->head != nullptr) list->head->previous = item;
  list->head = item;
  return item;
}

void asn1_list_free(const asn1_list_of& kind, asn1_list* list) {
  while (list->head != nullptr) {
    asn1_link* item = list->head;
    list->head = item->next;
    kind.type->free(member(item, kind.value_offset));
    heap_give_back(item, kind.item_size);
  }
}

int32_t asn1_list_write(const asn1_list_of& kind, der_cursor* out, const asn1_list& list) {
  int32_t total = 0;
  for (const asn1_link* item = list.head; item != nullptr; item = item->next) {
    const int32_t written = kind.type->write(out, member(item, kind.value_offset));
    if (written < 0) return written;
    total += written;
  }
  return der_wrap(out, kind.tag, total);
}

void* asn1_alloc(const asn1_type& type, size_t size) {
  void* record = take(size);
  if (record != nullptr) type.initialise(record);
  return record;
}

void asn1_release(const asn1_type& type, void* record, size_t size) {
  if (record == nullptr) return;
  type.free(record);
  heap_give_back(record, size);
}

int32_t asn1_encode(const asn1_type& type, const void* value, byte_span buffer) {
  der_cursor out(buffer);
  const int32_t length = type.write(&out, value);
  if (length < 0) return length;
  // Forwards and in order: source and destination may overlap.
  const byte_span encoding = out.written();
  for (size_t i = 0; i < encoding.size(); i++)
    buffer[i] = encoding[i];
  return length;
}

int32_t asn1_encode_growing(const asn1_type& type, const void* value, size_t first_size,
                            heap_buffer* encoding) {
  for (size_t size = first_size;; size *= 2) {
    encoding->reset();
    if (!encoding->allocate(size)) {
      trace(TEE_TRACE_ERROR, "Out of memory, need %uB", static_cast<unsigned>(size));
      return DER_NO_MEMORY;
    }
    const int32_t length = asn1_encode(type, value, encoding->span());
    if (length == DER_TOO_SMALL) continue;
    encoding->truncate(length < 0 ? 0 : static_cast<size_t>(length));
    return length;
  }
}

}  // namespace keymaster
