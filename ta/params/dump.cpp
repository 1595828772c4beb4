// Debug trace of a parameter set.
#include "ta/params/dump.h"

namespace keymaster {
namespace {

void dump_value(const keymaster_key_param_t& param) {
  const uint32_t level = TEE_TRACE_DEBUG;
  switch (tag_class(param.tag)) {
    case KM_INVALID:
      return trace(level, "    KM_INVALID");
    case KM_ENUM:
    case KM_ENUM_REP:
      return trace(level, "    KM_ENUM: %d", static_cast<int>(param.enumerated));
    case KM_UINT:
    case KM_UINT_REP:
      return trace(level, "    KM_UINT: 0x%08x", param.integer);
    case KM_ULONG:
    case KM_ULONG_REP:
      return trace(level, "    KM_ULONG: 0x%016llx",
                   static_cast<unsigned long long>(param.long_integer));
    case KM_DATE:
      return trace(level, "    KM_DATE: 0x%016llx",
                   static_cast<unsigned long long>(param.date_time));
    case KM_BOOL:
      return trace(level, "    KM_BOOL: %d", param.boolean);
    case KM_BIGNUM:
      return trace(level, "    KM_BIGNUM, length %dB", static_cast<int>(param.data_length));
    case KM_BYTES:
      return trace(level, "    KM_BYTES, length %dB", static_cast<int>(param.data_length));
    default:
      return trace(level, "    Invalid tag type");
  }
}

}  // namespace

void _keymaster_dump_key_param_set(const char* file, int line,
                                   const keymaster_key_param_set_t& set) {
  const trace_scope scope;
  trace(TEE_TRACE_DEBUG, "Dump at %s:%d", file, line);
  for (const keymaster_key_param_t& param : set) {
    trace(TEE_TRACE_DEBUG, "Tag: 0x%08x", param.tag);
    dump_value(param);
  }
}

}  // namespace keymaster
