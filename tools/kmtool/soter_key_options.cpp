// The tags of SOTER keys.
#include "soter_key_options.h"

#include "files.h"
#include "tool.h"

namespace kmtool {

using namespace keymaster;
using client::param_set;

namespace {

constexpr std::string_view KEY_PREFIX = "key=";

void add_export_sign(const std::string& choice, param_set* tags) {
  if (choice == "none") return;
  if (choice == "attk") {
    tags->add_flag(KM_TAG_SOTER_ATTK_SIGNS);
  } else if (choice.starts_with(KEY_PREFIX)) {
    tags->add_flag(KM_TAG_SOTER_KEY_SIGNS);
    tags->add_bytes(KM_TAG_SOTER_SIGN_KEY_BLOB, read_file(choice.substr(KEY_PREFIX.size())));
  } else {
    throw failure(WRONG_USAGE, "--export-sign: '" + choice + "' is not attk, none or key=FILE");
  }
}

}  // namespace

void soter_key_options::add_to(CLI::App* verb) {
  CLI::Option* soter = verb->add_flag("--soter", wanted,
                                      "An RSA key that signs documents: the message with "
                                      "fingerprint, counter, uid and the device's properties");
  add_number(verb, "--uid", &uid, "User id that its documents name")->needs(soter);
  verb->add_option("--export-sign", export_sign,
                   "What signs its public key: attk (default), another RSA key, or none, which "
                   "makes export impossible")
      ->type_name("attk|key=FILE|none")
      ->needs(soter);
  verb->add_flag("--counter", counter, "Each export raises the device's counter and names it")
      ->needs(soter);
}

param_set soter_key_options::tags(uint32_t algorithm) const {
  param_set tags;
  if (!wanted) return tags;
  if (algorithm != KM_ALGORITHM_RSA) {
    throw failure(WRONG_USAGE, "--soter: only RSA keys sign documents");
  }
  tags.add_flag(KM_TAG_SOTER_KEY);
  if (uid) tags.add(KM_TAG_SOTER_UID, *uid);
  if (counter) tags.add_flag(KM_TAG_SOTER_COUNTER);
  add_export_sign(export_sign, &tags);
  return tags;
}

}  // namespace kmtool
