// Attestation certificates from others, as `kmtool inspect` reads them. The first byte chooses: the
// rest is the DER of a key description, or a file of certificates. All that is not as it should be
// is an attestation_error; what is accepted reads the same again.
#include <cstdlib>

#include "tools/kmtool/attestation.h"

using namespace kmtool;

namespace {

void require(bool holds) {
  if (!holds) std::abort();
}

void check_description(byte_view der) {
  const key_description found = parse_key_description(der);
  const bytes trailing = [&] {
    bytes longer(der.begin(), der.end());
    longer.push_back(0);
    return longer;
  }();
  require(parse_key_description(trailing).tee_enforced.params == found.tee_enforced.params);
}

void check_file(byte_view file) {
  const std::vector<certificate> chain = parse_certificates(file);
  require(!chain.empty());
  std::string pem;
  for (const certificate& link : chain)
    pem += to_pem(link.get());
  const auto again = parse_certificates({reinterpret_cast<const uint8_t*>(pem.data()), pem.size()});
  require(again.size() == chain.size());
  for (size_t i = 0; i < chain.size(); i++) {
    require(X509_cmp(chain[i].get(), again[i].get()) == 0);
    find_key_description(chain[i].get());
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size == 0) return 0;
  const byte_view rest(data + 1, size - 1);
  try {
    if (data[0] % 2 == 0) {
      check_description(rest);
    } else {
      check_file(rest);
    }
  } catch (const attestation_error&) {
    // A refusal.
  }
  return 0;
}
