// TLV box.
#include "ta/soter/tlv_box.h"

#include <cstring>

#include "ta/base/trace.h"

namespace keymaster {
namespace {

constexpr size_t ITEM_HEADER = 4;

void trace_out_of_memory(size_t size) {
  trace(TEE_TRACE_ERROR, "Out of memory, need %dB", static_cast<int>(size));
}

}  // namespace

heap_ptr<tlv_box> tlv_box_create() {
  const trace_scope scope;
  heap_ptr<tlv_box> box(heap_new<tlv_box>());
  if (!box) trace_out_of_memory(sizeof(tlv_box));
  return box;
}

heap_ptr<tlv_box> tlv_box_parse(byte_view buffer) {
  const trace_scope scope;
  heap_ptr<tlv_box> box = tlv_box_create();
  if (!box) return {};
  heap_buffer copy;
  if (!copy.copy_of(buffer)) {
    trace_out_of_memory(buffer.size());
    return {};
  }
  input_cursor in(copy.view());
  uint16_t tag = 0;
  uint16_t length = 0;
  byte_view value;
  while (in.read_u16(&tag) && in.read_u16(&length) && in.read_bytes(length, &value)) {
    // A repeated tag is refused: the first occurrence counts.
    if (tlv_box_putobject(box.get(), tag, value) != 0 && box->items.get(tag) == nullptr) return {};
  }
  box->length = copy.size();
  box->serialized = std::move(copy);
  return box;
}

int tlv_box_serialize(tlv_box* box) {
  const trace_scope scope;
  if (box->is_closed()) return -1;
  heap_buffer serialized;
  if (!serialized.allocate(box->length)) {
    trace_out_of_memory(box->length);
    return -1;
  }
  output_cursor out(serialized.span());
  for (const key_list::item* item = box->items.head(); item != nullptr; item = item->next) {
    if (!out.write_u16(item->key) || !out.write_u16(static_cast<uint16_t>(item->value.size())) ||
        !out.write_bytes(item->value.view())) {
      return -1;  // not reached: `length` counts every item
    }
  }
  box->serialized = std::move(serialized);
  return 0;
}

byte_view tlv_box_get_buffer(const tlv_box& box) {
  return box.serialized.view();
}

size_t tlv_box_get_size(const tlv_box& box) {
  return box.length;
}

int tlv_box_putobject(tlv_box* box, uint16_t tag, byte_view value) {
  const trace_scope scope;
  if (box->is_closed() || box->items.get(tag) != nullptr || value.size() > UINT16_MAX) return -1;
  heap_buffer copy;
  if (!copy.copy_of(value)) {
    trace_out_of_memory(value.size());
    return -1;
  }
  if (!box->items.add(tag, std::move(copy))) return -1;
  box->length += ITEM_HEADER + value.size();
  return 0;
}

int tlv_box_put_string(tlv_box* box, uint16_t tag, const char* text) {
  return tlv_box_putobject(box, tag, {reinterpret_cast<const uint8_t*>(text), strlen(text) + 1});
}

int tlv_box_put_bytes(tlv_box* box, uint16_t tag, byte_view bytes) {
  return tlv_box_putobject(box, tag, bytes);
}

int tlv_box_put_object(tlv_box* box, uint16_t tag, const tlv_box& object) {
  return object.is_closed() ? tlv_box_putobject(box, tag, tlv_box_get_buffer(object)) : -1;
}

int tlv_box_get_bytes_ptr(const tlv_box& box, uint16_t tag, byte_view* bytes) {
  const heap_buffer* value = box.items.get(tag);
  if (value == nullptr) return -1;
  *bytes = value->view();
  return 0;
}

int tlv_box_get_bytes(const tlv_box& box, uint16_t tag, byte_span buffer, size_t* length) {
  byte_view value;
  if (tlv_box_get_bytes_ptr(box, tag, &value) != 0 || buffer.size() < value.size()) return -1;
  wipe(buffer);
  copy_bytes(buffer, value);
  *length = value.size();
  return 0;
}

int tlv_box_get_object(const tlv_box& box, uint16_t tag, heap_ptr<tlv_box>* object) {
  byte_view value;
  if (tlv_box_get_bytes_ptr(box, tag, &value) != 0) return -1;
  *object = tlv_box_parse(value);
  return *object ? 0 : -1;
}

}  // namespace keymaster
