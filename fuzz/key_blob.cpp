// Key blobs. The first byte chooses: the rest is a blob as it is, or what lies sealed in one, so
// that the parsing behind the authentication is reached. Every command that opens blobs takes it;
// none leaves anything alive (the harness sees to that), and what is answered is in its form.
#include <algorithm>

#include "support/blob_forge.h"
#include "support/ta_under_test.h"

using namespace keymaster;
using namespace keymaster::test;

namespace {

void require(bool holds) {
  if (!holds) std::abort();
}

// Characteristics are what was sealed, less the hidden tags; an upgrade seals the same key.
void check_opened(ta_under_test* ta, byte_view blob, byte_view plaintext) {
  const reply described = ta->send(key_request(command::GET_KEY_CHARACTER, blob));
  if (described.ok()) param_set::parse(described.output());
  const reply upgraded = ta->upgrade(blob);
  if (!upgraded.ok()) return;
  const bytes sealed = unseal(upgraded.output());
  client::field_reader before(plaintext);
  client::field_reader after(sealed);
  require(std::ranges::equal(before.field(), after.field()));
  require(ta->send(key_request(command::GET_KEY_CHARACTER, upgraded.output())).ok());
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const bool armed = (GTEST_FLAG_SET(break_on_failure, true), true);
  static ta_under_test ta({.rpmb = false, .trace_level = 0});
  if (size == 0 || !armed) return 0;
  const byte_view rest(data + 1, size - 1);
  const bytes blob = data[0] % 2 == 0 ? bytes(rest.begin(), rest.end()) : seal(rest);
  ta.send(key_request(command::GET_KEY_CHARACTER_SIZE, blob));
  ta.send(key_request(command::EXPORT_KEY, blob));
  for (uint32_t purpose = 0; purpose < 4; purpose++) {
    const param_set use = param_set()
                              .add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256)
                              .add(KM_TAG_BLOCK_MODE, KM_MODE_CTR)
                              .add(KM_TAG_PADDING, KM_PAD_NONE)
                              .add(KM_TAG_MAC_LENGTH, 128);
    const reply begun = ta.begin(purpose, blob, use);
    if (!begun.ok()) continue;
    const bool fed = ta.update(begun.b, rest.first(std::min<size_t>(rest.size(), 16))).ok();
    if (fed) ta.finish(begun.b);
  }
  if (data[0] % 2 == 1) check_opened(&ta, blob, rest);
  return 0;
}
