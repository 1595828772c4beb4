// The JSON documents of SOTER keys.
#include "ta/soter/documents.h"

#include <algorithm>

#include "ta/alg/rsa/rsa.h"
#include "ta/soter/attk.h"
#include "ta/soter/counter.h"
#include "ta/soter/finger_id.h"
#include "ta/soter/json.h"
#include "ta/soter/provisioning.h"
#include "ta/soter/utf8.h"

namespace keymaster {
namespace {

// Whether setting a member went well.
bool is_set(int error, const char* member, trace_site at) {
  if (error != 0) trace_error(at, "set %s error %d\n", member, error);
  return error == 0;
}

bool make_root(json_value* root, trace_site at) {
  if (root->make_object()) return true;
  trace_error(at, "json error root_value %p root_object %p\n", static_cast<const void*>(root),
              static_cast<const void*>(root->object()));
  return false;
}

bool serialize(const json_value& root, heap_buffer* document, trace_site at) {
  if (json_serialize(root, document)) return true;
  trace_error(at, "json serialization error\n");
  return false;
}

bool is_text(byte_view raw, trace_site at) {
  const auto length = static_cast<size_t>(std::ranges::find(raw, 0) - raw.begin());
  if (length == raw.size() && is_valid_utf8(raw)) return true;
  trace_error(at, "Not a valid utf8 string, strlen(raw) %d length %d", static_cast<int>(length),
              static_cast<int>(raw.size()));
  return false;
}

// A document without the finger is one that the server may still accept.
bool set_finger(json_list* members, trace_site at) {
  uint32_t fid = 0;
  if (TEE_Result res = get_fid(&fid)) {
    trace_error(at, "get finger id error %x, continue without fid\n", res);
    return true;
  }
  return is_set(json_set_number(members, "fid", fid), "finger id", at);
}

TEE_Result set_counter(json_list* members, trace_site at) {
  uint64_t counter = 0;
  if (TEE_Result res = increase_and_get_counter(&counter)) {
    trace_error(at, "increase counter error %x\n", res);
    return res;
  }
  const int error = json_set_number(members, "counter", static_cast<double>(counter));
  return is_set(error, "counter", at) ? TEE_SUCCESS : TEE_ERROR_OUT_OF_MEMORY;
}

// The versions may be missing: intended, a document goes on without them.
bool set_device(json_list* members, trace_site at) {
  const soter_prop_set_t& device = soter_prop_set();
  const struct {
    const char* member;
    byte_view text;
    const char* name;
    bool may_miss;
  } rows[] = {
      {"tee_n", device.tee_name.view(), "tee name", false},
      {"tee_v", device.tee_version.view(), "tee version", true},
      {"fp_n", device.fp_name.view(), "fp sensor name", false},
      {"fp_v", device.fp_version.view(), "fp sensor version", true},
      {"cpu_id", device.cpu_id.view(), "cpu id", false},
  };
  return std::ranges::all_of(rows, [&](const auto& row) {
    return is_set(json_set_string(members, row.member, row.text), row.name, at) || row.may_miss;
  });
}

// Room for the PEM text of a public key: 4/3 of modulus and exponent, which may be as long as each
// other.
size_t pem_capacity(uint32_t key_bits) {
  constexpr size_t USUAL = 1024;  // up to 2048 bits
  return std::max(USUAL, size_t{key_bits} / 8 * 4);
}

TEE_Result set_public_key(json_list* members, byte_view key_material, trace_site at) {
  uint32_t key_bits = 0;
  const tee_object key = resolve_key_from_data(key_material, &key_bits);
  if (!key) {
    trace_error(at, "resolve key from data stream error\n");
    return TEE_ERROR_BAD_FORMAT;
  }
  heap_buffer pem;
  if (!pem.allocate(pem_capacity(key_bits))) {
    trace_error(at, "Out of memory");
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  size_t length = 0;
  if (TEE_Result res = export_rsa_public_key(key.get(), key_bits, pem.span(), &length)) {
    trace_error(at, "export public key error\n");
    return res;
  }
  const int error = json_set_string(members, "pub_key", pem.view().first(length));
  return is_set(error, "publickey", at) ? TEE_SUCCESS : TEE_ERROR_BAD_STATE;
}

}  // namespace

bool produce_soter_sign_json(uint64_t uid, byte_view raw, heap_buffer* document) {
  const trace_site at = trace_site::here();
  document->reset();
  if (soter_check_init() != TEE_SUCCESS) {
    TRACE_ERROR("soter is not ready\n");
    return false;
  }
  json_value root;
  if (!make_root(&root, at) || !is_text(raw, at)) return false;
  json_list* members = root.object();
  if (!is_set(json_set_string(members, "raw", raw), "raw message", at) ||
      !set_finger(members, at) || set_counter(members, at) != TEE_SUCCESS ||
      !is_set(json_set_number(members, "uid", static_cast<double>(uid)), "uid", at) ||
      !set_device(members, at) || !serialize(root, document, at)) {
    return false;
  }
  TRACE_DEBUG("%s success", at.function);
  return true;
}

TEE_Result produce_soter_export_json(const keymaster_key_param_set_t& key_params,
                                     byte_view key_material, heap_buffer* document, trace_site at) {
  document->reset();
  json_value root;
  if (!make_root(&root, at)) return TEE_ERROR_OUT_OF_MEMORY;
  json_list* members = root.object();
  if (contains_tag(key_params, KM_TAG_SOTER_COUNTER)) {
    trace(TEE_TRACE_DEBUG, at, "This key need increase the counter");
    if (TEE_Result res = set_counter(members, at)) return res;
  }
  if (const auto* uid = get_unique(key_params, KM_TAG_SOTER_UID)) {
    trace(TEE_TRACE_DEBUG, at, "soter key has uid\n");
    if (int error = json_set_number(members, "uid", uid->integer)) {
      trace_error(at, "set number error %x\n", static_cast<unsigned>(error));
      return TEE_ERROR_OUT_OF_MEMORY;
    }
  }
  if (TEE_Result res = set_public_key(members, key_material, at)) return res;
  return serialize(root, document, at) ? TEE_SUCCESS : TEE_ERROR_BAD_STATE;
}

}  // namespace keymaster
