// The JSON documents of SOTER keys.
#include "ta/soter/documents.h"

#include <algorithm>

#include "ta/alg/rsa/rsa.h"
#include "ta/base/outcome.h"
#include "ta/soter/attk.h"
#include "ta/soter/counter.h"
#include "ta/soter/finger_id.h"
#include "ta/soter/json.h"
#include "ta/soter/provisioning.h"
#include "ta/soter/utf8.h"

namespace keymaster {
namespace {

// Whether setting a member went well.
bool is_set(int error, const char* member) {
  if (error != 0) trace(TEE_TRACE_ERROR, "set %s error %d\n", member, error);
  return error == 0;
}

bool make_root(json_value* root) {
  if (root->make_object()) return true;
  trace(TEE_TRACE_ERROR, "json error root_value %p root_object %p\n",
        static_cast<const void*>(root), static_cast<const void*>(root->object()));
  return false;
}

bool serialize(const json_value& root, heap_buffer* document) {
  if (json_serialize(root, document)) return true;
  trace(TEE_TRACE_ERROR, "json serialization error\n");
  return false;
}

bool is_text(byte_view raw) {
  const auto length = static_cast<size_t>(std::ranges::find(raw, 0) - raw.begin());
  if (length == raw.size() && is_valid_utf8(raw)) return true;
  trace(TEE_TRACE_ERROR, "Not a valid utf8 string, strlen(raw) %d length %d",
        static_cast<int>(length), static_cast<int>(raw.size()));
  return false;
}

// A document without the finger is one that the server may still accept.
bool set_finger(json_list* members) {
  uint32_t fid = 0;
  if (TEE_Result res = get_fid(&fid)) {
    trace(TEE_TRACE_ERROR, "get finger id error %x, continue without fid\n", res);
    return true;
  }
  return is_set(json_set_number(members, "fid", fid), "finger id");
}

TEE_Result set_counter(json_list* members) {
  uint64_t counter = 0;
  if (TEE_Result res = increase_and_get_counter(&counter)) {
    return fail(res, "increase counter error %x\n", res);
  }
  const int error = json_set_number(members, "counter", static_cast<double>(counter));
  return is_set(error, "counter") ? TEE_SUCCESS : TEE_ERROR_OUT_OF_MEMORY;
}

// The versions may be missing: intended, a document goes on without them.
bool set_device(json_list* members) {
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
    return is_set(json_set_string(members, row.member, row.text), row.name) || row.may_miss;
  });
}

// Room for the PEM text of a public key: 4/3 of modulus and exponent, which may be as long as each
// other.
size_t pem_capacity(uint32_t key_bits) {
  constexpr size_t USUAL = 1024;  // up to 2048 bits
  return std::max(USUAL, size_t{key_bits} / 8 * 4);
}

TEE_Result set_public_key(json_list* members, byte_view key_material) {
  uint32_t key_bits = 0;
  const tee_object key = resolve_key_from_data(key_material, &key_bits);
  if (!key) return fail(TEE_ERROR_BAD_FORMAT, "resolve key from data stream error\n");
  heap_buffer pem;
  if (!pem.allocate(pem_capacity(key_bits))) {
    return fail(TEE_ERROR_OUT_OF_MEMORY, "Out of memory");
  }
  size_t length = 0;
  if (TEE_Result res = export_rsa_public_key(key.get(), key_bits, pem.span(), &length)) {
    return fail(res, "export public key error\n");
  }
  const int error = json_set_string(members, "pub_key", pem.view().first(length));
  return is_set(error, "publickey") ? TEE_SUCCESS : TEE_ERROR_BAD_STATE;
}

}  // namespace

bool produce_soter_sign_json(uint64_t uid, byte_view raw, heap_buffer* document) {
  const trace_scope scope;
  document->reset();
  if (soter_check_init() != TEE_SUCCESS) {
    trace(TEE_TRACE_ERROR, "soter is not ready\n");
    return false;
  }
  json_value root;
  if (!make_root(&root) || !is_text(raw)) return false;
  json_list* members = root.object();
  if (!is_set(json_set_string(members, "raw", raw), "raw message") || !set_finger(members) ||
      set_counter(members) != TEE_SUCCESS ||
      !is_set(json_set_number(members, "uid", static_cast<double>(uid)), "uid") ||
      !set_device(members) || !serialize(root, document)) {
    return false;
  }
  trace(TEE_TRACE_DEBUG, "%s success", trace_scope::current());
  return true;
}

TEE_Result produce_soter_export_json(const keymaster_key_param_set_t& key_params,
                                     byte_view key_material, heap_buffer* document) {
  document->reset();
  json_value root;
  if (!make_root(&root)) return TEE_ERROR_OUT_OF_MEMORY;
  json_list* members = root.object();
  if (contains_tag(key_params, KM_TAG_SOTER_COUNTER)) {
    trace(TEE_TRACE_DEBUG, "This key need increase the counter");
    TRY(set_counter(members));
  }
  if (const auto* uid = get_unique(key_params, KM_TAG_SOTER_UID)) {
    trace(TEE_TRACE_DEBUG, "soter key has uid\n");
    if (int error = json_set_number(members, "uid", uid->integer)) {
      return fail(TEE_ERROR_OUT_OF_MEMORY, "set number error %x\n", static_cast<unsigned>(error));
    }
  }
  TRY(set_public_key(members, key_material));
  return serialize(root, document) ? TEE_SUCCESS : TEE_ERROR_BAD_STATE;
}

}  // namespace keymaster
