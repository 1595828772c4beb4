// kmtool soter check-attk | export-attk | device-id | fingerprint | export | verify
#include "files.h"
#include "keymaster_device.h"
#include "operands.h"
#include "options.h"
#include "soter_document.h"

namespace kmtool {

using namespace keymaster;

namespace {

constexpr char PROVISION_ADVICE[] =
    "'kmtool device provision' gives a device its key and properties.";

std::string as_text(byte_view data) {
  return {data.begin(), data.end()};
}

verb_result check_attk(const std::string& folder) {
  keymaster_device keymaster(folder);
  const client::attk_result checked = client::soter(keymaster.session()).check_attk();
  require(checked, "cannot check the ATTK");
  if (checked.state == client::attk_state::NOT_PROVISIONED) {
    throw failure(REFUSED, "the device has no ATTK (-1)", PROVISION_ADVICE);
  }
  if (checked.state == client::attk_state::UNREADABLE) {
    throw failure(REFUSED, "the device's ATTK cannot be loaded (-2)",
                  "--trace 3 tells what the vault answered.");
  }
  verb_result result;
  result.object = {{"attk", "ready"}};
  result.text = "The device's ATTK is ready\n";
  return result;
}

verb_result export_attk(const std::string& folder, const std::string& output) {
  keymaster_device keymaster(folder);
  const client::soter_result exported = client::soter(keymaster.session()).export_attk();
  if (exported.unavailable) {
    throw failure(REFUSED, "the device's SOTER data cannot be loaded (-1)", PROVISION_ADVICE);
  }
  require(exported, "cannot export the ATTK");
  const std::string pem = as_text(exported.data) + "\n";
  verb_result result;
  result.object = {{"public_key", pem}};
  if (output.empty()) {
    result.text = pem;
    return result;
  }
  write_file(output, client::as_bytes(pem), access::NORMAL);
  result.object["output"] = output;
  if (output != "-") result.text = "Wrote the ATTK's public key to " + output + "\n";
  return result;
}

verb_result device_id(const std::string& folder) {
  keymaster_device keymaster(folder);
  const client::soter_result id = client::soter(keymaster.session()).device_id();
  if (id.error == KM_ERROR_UNKNOWN_ERROR) {
    throw failure("cannot read the device's identifier", id, PROVISION_ADVICE);
  }
  require(id, "cannot read the device's identifier");
  verb_result result;
  result.object = {{"device_id", as_text(id.data)}};
  result.text = escape_controls(as_text(id.data)) + "\n";
  return result;
}

verb_result report_match(const std::string& folder, uint32_t fid) {
  keymaster_device keymaster(folder);
  report_fingerprint(keymaster, fid);
  verb_result result;
  result.object = {{"fid", fid}, {"accepted", true}};
  result.text = "The Keymaster took the report of fingerprint " + std::to_string(fid) +
                "; it forgets it when this call ends ('kmtool sign --fingerprint' uses one)\n";
  return result;
}

struct document_export_options {
  std::string key;
  document_files files;
  std::string public_key;  // file for it alone
  application_options application;
};

verb_result export_document(const std::string& folder, const document_export_options& options) {
  options.files.check(options.key);
  const bytes blob = read_file(options.key);
  keymaster_device keymaster(folder);
  const client::application app = options.application.get();
  auto key = keymaster->get_key_characteristics(blob, app);
  require_opened(keymaster.session(), options.key, blob, app, key);
  if (!key.characteristics.contains(KM_TAG_SOTER_KEY)) {
    throw failure(WRONG_USAGE, options.key + " is no SOTER key",
                  "'kmtool export' gives its public key.");
  }
  const client::data_result exported = keymaster->export_key(blob, app);
  require(exported, "cannot export the key");
  // The command tells of no failure but by putting out nothing.
  if (exported.data.empty()) {
    throw failure(REFUSED, "the key's document could not be made or signed",
                  "What signs it is chosen with generate's --export-sign: the ATTK, which the "
                  "device must have ('kmtool soter check-attk'), or an RSA key of 2048 bits at "
                  "most. -v tells what failed.");
  }
  const client::signed_document made = client::parse_signed_document(exported.data);
  if (!options.public_key.empty()) {
    const std::string pem = json::parse(made.text()).at("pub_key");
    write_file(options.public_key, client::as_bytes(pem + "\n"), access::NORMAL);
  }
  verb_result result = deliver(made, options.files);
  result.object["key"] = options.key;
  return result;
}

struct document_verify_options {
  std::string document;
  std::string signature;
  std::string key;
  std::optional<uint32_t> digest;
};

verb_result verify_document(const document_verify_options& options) {
  const bytes document = read_file(options.document);
  const bytes signature = read_file(options.signature, MAX_SIGNATURE_FILE);
  const bytes key = read_file(options.key);
  const std::optional<std::string> padding = verifying_padding(
      document, signature, options.digest.value_or(KM_DIGEST_SHA_2_256), options.key, key);
  if (!padding) {
    const std::string hint = document.back() == 0
                                 ? "Give the key that signed it, and --digest unless it is sha256."
                                 : "The signature covers the zero byte behind the text, which is "
                                   "missing here.";
    throw failure(
        "the signature is not this key's over this document",
        client::status{TEEC_SUCCESS, TEEC_ORIGIN_TRUSTED_APP, KM_ERROR_VERIFICATION_FAILED}, hint)
        .answering({{"verified", false}});
  }
  std::string text = as_text(document);
  if (text.back() == 0) text.pop_back();
  verb_result result;
  result.object = {{"verified", true}, {"padding", *padding}, {"document", text}};
  result.text = escape_controls(text) + "\n";
  return result;
}

void add_plain_verbs(CLI::App* soter, command_line* line) {
  soter->add_subcommand("check-attk", "Ask whether the device has its attestation key (ATTK)")
      ->callback([=] { line->action = [=] { return check_attk(line->device_name()); }; });

  CLI::App* verb = soter->add_subcommand("export-attk", "Export the ATTK's public key as PEM");
  auto output = std::make_shared<std::string>();
  add_output(verb, "-o,--output", output.get(), "File for the key; without it, it is printed");
  verb->callback([=] { line->action = [=] { return export_attk(line->device_name(), *output); }; });

  soter->add_subcommand("device-id", "Print the identifier that the factory gave the device")
      ->callback([=] { line->action = [=] { return device_id(line->device_name()); }; });

  verb = soter->add_subcommand("fingerprint", "Have the fingerprint application report a match");
  auto fid = std::make_shared<std::optional<uint32_t>>();
  add_number(verb, "FID", fid.get(), "Identifier of the fingerprint")->required();
  verb->callback([=] { line->action = [=] { return report_match(line->device_name(), **fid); }; });
}

void add_document_verbs(CLI::App* soter, command_line* line) {
  CLI::App* verb =
      soter->add_subcommand("export", "Export a SOTER key's public key in a signed document");
  auto exported = std::make_shared<document_export_options>();
  add_input(verb, "KEY", &exported->key, "File that holds the key blob")->required();
  exported->files.add_to(verb, "File for the document (default: both are printed)");
  add_output(verb, "--public-key", &exported->public_key,
             "File for the public key alone, in PEM, as the document has it");
  exported->application.add_to(verb);
  verb->callback(
      [=] { line->action = [=] { return export_document(line->device_name(), *exported); }; });

  verb = soter->add_subcommand("verify", "Verify a document's signature and print the document");
  auto checked = std::make_shared<document_verify_options>();
  add_input(verb, "DOCUMENT", &checked->document, "The document with its zero byte, as stored")
      ->required();
  add_input(verb, "SIGNATURE", &checked->signature, "The signature's bytes")->required();
  add_input(verb, "--key", &checked->key, "Public key of the signer, PEM or DER")->required();
  add_name(verb, "--digest", KM_TAG_DIGEST, &checked->digest, "Digest (default: sha256)");
  verb->callback([=] { line->action = [=] { return verify_document(*checked); }; });
}

}  // namespace

void add_soter_verbs(CLI::App* app, command_line* line) {
  CLI::App* soter = app->add_subcommand("soter", "The device's attestation key and documents");
  add_plain_verbs(soter, line);
  add_document_verbs(soter, line);
}

}  // namespace kmtool
