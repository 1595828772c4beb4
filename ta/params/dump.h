// Debug trace of a parameter set.
#pragma once

#include "ta/params/param_set.h"

namespace keymaster {

// _keymaster_dump_key_param_set: one "Dump at file:line" line, then two lines an entry: its tag,
// and its value by class. Blobs show their length alone. Debug level.
void _keymaster_dump_key_param_set(const char* file, int line,
                                   const keymaster_key_param_set_t& set);

#define KEYMASTER_DUMP_KEY_PARAM_SET(set) \
  ::keymaster::_keymaster_dump_key_param_set(__FILE__, __LINE__, set)

}  // namespace keymaster
