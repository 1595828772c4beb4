// The vault's record, and the TLV boxes in it: items of u16 tag, u16 length and value,
// little-endian.
#include "keymaster/client/vault.h"

#include <stdexcept>

#include "ta/vault/items.h"

namespace keymaster::client {

namespace {

constexpr uint32_t PROVISION = 100;

void add_item(field_writer* box, uint16_t tag, byte_view value) {
  if (value.size() > UINT16_MAX) throw std::length_error("a TLV item of more than 65535 bytes");
  box->u32(tag | static_cast<uint32_t>(value.size()) << 16).raw(value);
}

bytes key_box(const rsa_numbers& key) {
  if (key.n.empty()) return {};
  field_writer box;
  add_item(&box, KEY_N, key.n);
  add_item(&box, KEY_E, key.e);
  add_item(&box, KEY_D, key.d);
  if (key.p.empty()) return box.take();
  add_item(&box, KEY_P, key.p);
  add_item(&box, KEY_Q, key.q);
  add_item(&box, KEY_DP, key.dp);
  add_item(&box, KEY_DQ, key.dq);
  add_item(&box, KEY_QINV, key.qinv);
  return box.take();
}

// The UUID as a trusted application holds it: three numbers, little-endian, then eight bytes.
bytes uuid_in_memory(const TEEC_UUID& uuid) {
  return field_writer()
      .u32(uuid.timeLow)
      .u32(uuid.timeMid | uint32_t{uuid.timeHiAndVersion} << 16)
      .raw(uuid.clockSeqAndNode)
      .take();
}

bytes property_box(const factory_data& data) {
  field_writer box;
  add_item(&box, FP_NAME, as_bytes(data.fingerprint_name));
  add_item(&box, FP_VERSION, as_bytes(data.fingerprint_version));
  add_item(&box, FP_UUID, uuid_in_memory(data.fingerprint_application));
  return box.take();
}

}  // namespace

rsa_numbers read_rsa_numbers(byte_view key_data) {
  field_reader reader(key_data);
  rsa_numbers key;
  for (bytes* number : {&key.n, &key.e, &key.d, &key.p, &key.q, &key.dp, &key.dq, &key.qinv}) {
    *number = copy_of(reader.field());
  }
  reader.finish();
  return key;
}

status vault::provision(const factory_data& data) {
  bytes record = field_writer()
                     .field(key_box(data.attk))
                     .field(data.ta_data)
                     .field(property_box(data))
                     .field(as_bytes(data.cpu_id))
                     .field(as_bytes(data.device_id))
                     .take();
  parameter_slots slots{};
  slots[0].tmpref = {record.data(), record.size()};
  return connection_.invoke(
      PROVISION, TEEC_PARAM_TYPES(TEEC_MEMREF_TEMP_INPUT, TEEC_NONE, TEEC_NONE, TEEC_NONE), &slots);
}

}  // namespace keymaster::client
