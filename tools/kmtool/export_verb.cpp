// kmtool export
#include "files.h"
#include "key_formats.h"
#include "keymaster/client/names.h"
#include "keymaster_device.h"
#include "operands.h"
#include "options.h"
#include "tool.h"

namespace kmtool {

using namespace keymaster;

namespace {

struct export_options {
  std::string key;
  std::string output;  // empty: printed
  bool der = false;
  application_options application;
};

verb_result export_public(const std::string& folder, const export_options& options) {
  const bytes blob = read_file(options.key);
  keymaster_device keymaster(folder);
  auto key = keymaster->get_key_characteristics(blob, options.application.get());
  require_opened(keymaster.session(), options.key, blob, options.application.get(), key);
  if (key.characteristics.contains(KM_TAG_SOTER_KEY)) {
    throw failure(WRONG_USAGE, options.key + " is a SOTER key",
                  "'kmtool soter export' gives the signed document with its public key.");
  }
  client::data_result exported = keymaster->export_key(blob, options.application.get());
  require(exported, "cannot export the key");
  const uint64_t algorithm = key.characteristics.number(KM_TAG_ALGORITHM).value_or(0);
  const bytes der = public_key_der(static_cast<uint32_t>(algorithm), exported.data);
  const std::string pem = public_key_pem(der);
  const byte_view text(reinterpret_cast<const uint8_t*>(pem.data()), pem.size());
  verb_result result;
  result.object = {{"key", options.key}, {"public_key", pem}};
  if (options.output.empty()) {
    if (options.der) throw failure(WRONG_USAGE, "--der: give -o FILE, or -o - for standard output");
    result.text = pem;
    return result;
  }
  write_file(options.output, options.der ? byte_view(der) : text, access::NORMAL);
  result.object["output"] = options.output;
  if (options.output != "-") result.text = "Wrote the public key to " + options.output + "\n";
  return result;
}

}  // namespace

void add_export_verb(CLI::App* app, command_line* line) {
  CLI::App* verb = app->add_subcommand("export", "Export the public key of an RSA or EC key");
  auto options = std::make_shared<export_options>();
  add_input(verb, "KEY", &options->key, "File that holds the key blob")->required();
  add_output(verb, "-o,--output", &options->output,
             "File for the public key; without it, it is printed");
  verb->add_flag("--der", options->der, "DER SubjectPublicKeyInfo instead of PEM");
  options->application.add_to(verb);
  verb->callback(
      [=] { line->action = [=] { return export_public(line->device_name(), *options); }; });
}

}  // namespace kmtool
