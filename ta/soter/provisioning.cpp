// SOTER's provisioned data: fetching, parsing, keeping.
#include "ta/soter/provisioning.h"

#include "ta/base/outcome.h"
#include "ta/soter/tlv_box.h"
#include "ta/vault/items.h"
#include "ta/vault/vault.h"

namespace keymaster {
namespace {

constexpr size_t KEY_BOX_CAPACITY = 8192;
constexpr size_t PROPERTY_CAPACITY = 512;
constexpr size_t CPU_ID_CAPACITY = 64;
constexpr size_t TEE_TEXT_CAPACITY = 64;

// Requests to the vault: two 16-bit little-endian words.
constexpr uint8_t REQUEST_PROPERTY_SET[] = {0x34, 0x18, 0x00, 0x00};  // 6196, 0
constexpr uint8_t REQUEST_CPU_ID[] = {0x34, 0x17, 0x3A, 0x17};

struct soter_data_t {
  soter_key_pair_t key_pair;
  soter_prop_set_t prop_set;
};

// Null until both records are loaded. A plain pointer: the TA has no runtime that would end
// globals.
soter_data_t* loaded;

// Fills one value of the key.
TEE_Result init_vlb_with_tag(heap_buffer* field, const tlv_box& box, uint16_t tag) {
  const trace_scope scope;
  byte_view value;
  if (tlv_box_get_bytes_ptr(box, tag, &value) != 0) {
    return fail(TEE_ERROR_BAD_PARAMETERS, "Get length error for %x\n", tag);
  }
  if (!field->allocate(value.size())) {
    return fail(TEE_ERROR_OUT_OF_MEMORY, "Fail to allocate memory for %x\n", tag);
  }
  size_t length = 0;
  const int rc = tlv_box_get_bytes(box, tag, field->span(), &length);
  if (rc == 0 && length == value.size()) return TEE_SUCCESS;
  return fail(TEE_ERROR_SHORT_BUFFER,
              "Fail to init attribute for %x, rc=%x, length(%d) capacity(%d)\n", tag,
              static_cast<unsigned>(rc), static_cast<int>(length), static_cast<int>(value.size()));
}

TEE_Result parse_buf_fill_key(soter_key_pair_t* key, byte_view serialized) {
  const trace_scope scope;
  const heap_ptr<tlv_box> box = tlv_box_parse(serialized);
  if (!box) return TEE_ERROR_OUT_OF_MEMORY;
  const struct {
    uint16_t tag;
    heap_buffer* field;
  } rows[] = {{KEY_N, &key->n}, {KEY_E, &key->e},   {KEY_D, &key->d},   {KEY_P, &key->p},
              {KEY_Q, &key->q}, {KEY_DP, &key->dp}, {KEY_DQ, &key->dq}, {KEY_QINV, &key->qinv}};
  for (const auto& [tag, field] : rows) {
    if (tag == KEY_P && box->items.get(KEY_P) == nullptr) {
      trace(TEE_TRACE_INFO, "This rsa key pair only have n, e, d\n");
      break;
    }
    TRY(init_vlb_with_tag(field, *box, tag));
  }
  return TEE_SUCCESS;
}

TEE_Result load_key(soter_key_pair_t* key) {
  heap_buffer serialized;
  if (!serialized.allocate(KEY_BOX_CAPACITY)) {
    return fail(TEE_ERROR_OUT_OF_MEMORY, "No memory for serialization\n");
  }
  size_t used = 0;
  TRY(retrieve_key_from_vault(serialized.data(), serialized.size(), &used));
  return parse_buf_fill_key(key, serialized.view().first(used));
}

TEE_Result retrieve_soter_property(heap_ptr<tlv_box>* box) {
  heap_buffer serialized;
  if (!serialized.allocate(PROPERTY_CAPACITY)) {
    trace(TEE_TRACE_DEBUG, "No memory for buf");
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  size_t length = serialized.size();
  TRY(retrieve_property_from_vault(REQUEST_PROPERTY_SET, serialized.data(), &length));
  *box = tlv_box_parse(serialized.view().first(length));
  if (*box) return TEE_SUCCESS;
  trace(TEE_TRACE_DEBUG, "parse property tlv box error");
  return TEE_ERROR_GENERIC;
}

TEE_Result init_prop_with_tag(heap_buffer* field, const tlv_box& box, uint16_t tag) {
  const trace_scope scope;
  byte_view value;
  if (tlv_box_get_bytes_ptr(box, tag, &value) != 0) {
    trace(TEE_TRACE_DEBUG, "tlv_box_get_bytes_ptr error for tag 0x%x\n", tag);
    return TEE_ERROR_GENERIC;
  }
  if (field->copy_of(value)) return TEE_SUCCESS;
  trace(TEE_TRACE_DEBUG, "No memory for prop->buf, tag 0x%x length %u\n", tag,
        static_cast<unsigned>(value.size()));
  return TEE_ERROR_OUT_OF_MEMORY;
}

TEE_Result init_fp_uuid(soter_prop_set_t* props, const tlv_box& box) {
  byte_view uuid;
  if (tlv_box_get_bytes_ptr(box, FP_UUID, &uuid) != 0) {
    trace(TEE_TRACE_DEBUG, "get fp uuid bytes ptr error");
    return TEE_ERROR_GENERIC;
  }
  if (uuid.size() != sizeof(props->fp_uuid)) {
    trace(TEE_TRACE_DEBUG, "fp_uuid length unmatch expect %zu actual %d\n", sizeof(props->fp_uuid),
          static_cast<int>(uuid.size()));
    return TEE_ERROR_GENERIC;
  }
  copy_bytes(props->fp_uuid, uuid);
  return TEE_SUCCESS;
}

TEE_Result init_soter_cpuid(heap_buffer* cpu_id) {
  const trace_scope scope;
  if (!cpu_id->allocate(CPU_ID_CAPACITY)) {
    trace(TEE_TRACE_DEBUG, "No memory for cpu_id");
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  size_t length = CPU_ID_CAPACITY;
  if (TEE_Result res = retrieve_property_from_vault(REQUEST_CPU_ID, cpu_id->data(), &length)) {
    trace(TEE_TRACE_DEBUG, "retrieve soter cpu id error 0x%x\n", res);
    return res;
  }
  cpu_id->truncate(length);
  return TEE_SUCCESS;
}

// Reads a text property of the TEE; `what` names the field in messages.
TEE_Result get_tee_property(heap_buffer* field, const char* property, const char* what) {
  if (!field->allocate(TEE_TEXT_CAPACITY)) {
    trace(TEE_TRACE_DEBUG, "No memory for %s", what);
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  auto* text = reinterpret_cast<char*>(field->data());
  auto size = static_cast<tee_size>(TEE_TEXT_CAPACITY);
  if (TEE_Result res =
          TEE_GetPropertyAsString(TEE_PROPSET_TEE_IMPLEMENTATION, property, text, &size)) {
    {
      const trace_scope scope;
      trace(TEE_TRACE_DEBUG, "get client id property error, 0x%x\n", res);
    }
    trace(TEE_TRACE_DEBUG, "get_tee_property os manufacturer error 0x%x\n", res);
    return res;
  }
  field->truncate(size == 0 ? 0 : size - 1);  // it counts the terminating zero
  return TEE_SUCCESS;
}

TEE_Result load_properties(soter_prop_set_t* props) {
  heap_ptr<tlv_box> box;
  TRY(retrieve_soter_property(&box));
  TRY(init_prop_with_tag(&props->fp_name, *box, FP_NAME));
  TRY(init_prop_with_tag(&props->fp_version, *box, FP_VERSION));
  TRY(init_fp_uuid(props, *box));
  if (TEE_Result res = init_soter_cpuid(&props->cpu_id)) {
    trace(TEE_TRACE_DEBUG, "init soter cpuid error 0x%x\n", res);
    return res;
  }
  TRY(get_tee_property(&props->tee_name, "gpd.tee.trustedos.manufacturer", "tee_name"));
  return get_tee_property(&props->tee_version, "gpd.tee.trustedos.implementation.version",
                          "tee_version");
}

}  // namespace

TEE_Result init_soter_key(soter_key_pair_t* key) {
  const trace_scope scope;
  *key = {};
  const TEE_Result res = load_key(key);
  trace(TEE_TRACE_DEBUG, "Init Soter key pair %s\n", res == TEE_SUCCESS ? "success" : "fail");
  if (res != TEE_SUCCESS) *key = {};
  return res;
}

TEE_Result init_soter_prop_set(soter_prop_set_t* props) {
  const trace_scope scope;
  *props = {};
  const TEE_Result res = load_properties(props);
  if (res == TEE_SUCCESS) {
    trace(TEE_TRACE_DEBUG, "Init soter data success\n");
  } else {
    trace(TEE_TRACE_DEBUG, "Init soter data fails, 0x%x\n", res);
    *props = {};
  }
  return res;
}

TEE_Result soter_init() {
  const trace_scope scope;
  heap_ptr<soter_data_t> data(heap_new<soter_data_t>());
  if (!data) return fail(TEE_ERROR_OUT_OF_MEMORY, "Out of memory");
  TRY(init_soter_key(&data->key_pair));
  TRY(init_soter_prop_set(&data->prop_set));
  soter_deinit();
  loaded = data.release();
  return TEE_SUCCESS;
}

TEE_Result soter_check_init() {
  return loaded != nullptr ? TEE_SUCCESS : soter_init();
}

void soter_forget() {
  loaded = nullptr;
}

void soter_deinit() {
  heap_delete(std::exchange(loaded, nullptr));
}

const soter_key_pair_t& soter_key_pair() {
  return loaded->key_pair;
}

const soter_prop_set_t& soter_prop_set() {
  return loaded->prop_set;
}

}  // namespace keymaster
