// kmtool sign | verify
#include <openssl/crypto.h>

#include "keymaster/client/names.h"
#include "operands.h"
#include "operation_run.h"
#include "soter_document.h"

namespace kmtool {

using namespace keymaster;
using client::param_set;

namespace {

std::optional<uint64_t> digest_for(const operation_options& options, const opened_key& key) {
  return choose(options.digest, key.characteristics, KM_TAG_DIGEST, {KM_DIGEST_SHA_2_256});
}

// Length in bits of an HMAC key's MAC that nobody shortened.
uint32_t whole_mac(const operation_options& options, const opened_key& key) {
  return client::digest_bits(digest_for(options, key).value_or(KM_DIGEST_NONE));
}

// The begin parameters: what was asked for, else what the key allows. Of several, SHA-256 and PSS.
param_set begin_params(const operation_options& options, const opened_key& key) {
  param_set params;
  const std::optional<uint64_t> digest = digest_for(options, key);
  if (digest) params.add(KM_TAG_DIGEST, *digest);
  const std::optional<uint64_t> padding =
      choose(options.padding, key.characteristics, KM_TAG_PADDING,
             {KM_PAD_RSA_PSS, KM_PAD_RSA_PKCS1_1_5_SIGN, KM_PAD_NONE});
  if (padding) params.add(KM_TAG_PADDING, *padding);
  if (key.algorithm() == KM_ALGORITHM_HMAC) {
    const uint32_t whole = whole_mac(options, key);
    check_mac(options.mac_bits, whole);
    params.add(KM_TAG_MAC_LENGTH, options.mac_bits.value_or(whole));
  } else if (options.mac_bits) {
    throw failure(WRONG_USAGE, "--mac: only HMAC keys sign with a MAC length");
  }
  return params;
}

bytes sign_input(keymaster_device* keymaster, const operation_options& options,
                 const opened_key& key) {
  input_file input(options.input);
  bytes signature;
  const sink keep = [&](byte_view data) { client::append(&signature, data); };
  operation_run run(keymaster, options, key, KM_PURPOSE_SIGN, begin_params(options, key), "sign");
  run.feed_file(&input, "Signing", keep);
  run.require(run.finish({}, keep));
  return signature;
}

// What SOTER keys alone have.
struct soter_sign_options {
  std::string signature_file;
  std::optional<uint32_t> fid;
};

// A SOTER key signs a document that it makes of the input.
verb_result sign_document(keymaster_device* keymaster, const operation_options& options,
                          const soter_sign_options& soter, const opened_key& key) {
  const document_files files = {options.output, soter.signature_file};
  files.check(options.key);
  if (soter.fid) report_fingerprint(*keymaster, *soter.fid);
  const bytes output = sign_input(keymaster, options, key);
  verb_result result = deliver(client::parse_signed_document(output), files);
  result.object["key"] = options.key;
  result.object["input"] = options.input;
  return result;
}

verb_result sign(const std::string& folder, const operation_options& options,
                 const soter_sign_options& soter) {
  keymaster_device keymaster(folder);
  const opened_key key = open_key(&keymaster, options);
  if (key.characteristics.contains(KM_TAG_SOTER_KEY)) {
    return sign_document(&keymaster, options, soter, key);
  }
  if (soter.fid || !soter.signature_file.empty()) {
    throw failure(WRONG_USAGE, "--fingerprint, --signature: " + options.key + " is no SOTER key",
                  "Other keys sign without a document; -o takes the signature.");
  }
  const bytes signature = sign_input(&keymaster, options, key);
  verb_result result;
  const std::string hex = client::to_hex(signature);
  result.object = {{"key", options.key}, {"input", options.input}, {"signature", hex}};
  if (options.output.empty()) {
    result.text = hex + "\n";
    return result;
  }
  write_file(options.output, signature, access::NORMAL);
  result.object["output"] = options.output;
  if (options.output != "-") {
    result.text = "Signed " + (options.input == "-" ? "standard input" : options.input) + "; " +
                  std::to_string(signature.size()) + " bytes in " + options.output + "\n";
  }
  return result;
}

// What the TA answers when a signature is not the key's. An HMAC operation never verifies: its MAC
// is computed again and compared.
bool verify_input(keymaster_device* keymaster, const operation_options& options,
                  const opened_key& key, const bytes& signature) {
  if (key.algorithm() == KM_ALGORITHM_HMAC) {
    operation_options again = options;
    const size_t bits = signature.size() * 8;
    if (bits > whole_mac(options, key)) return false;
    again.mac_bits = static_cast<uint32_t>(bits);
    const bytes mac = sign_input(keymaster, again, key);
    return mac.size() == signature.size() &&
           CRYPTO_memcmp(mac.data(), signature.data(), mac.size()) == 0;
  }
  input_file input(options.input);
  const sink nowhere = [](byte_view) {};
  operation_run run(keymaster, options, key, KM_PURPOSE_VERIFY, begin_params(options, key),
                    "verify");
  run.feed_file(&input, "Verifying", nowhere);
  const client::status outcome = run.finish(signature, nowhere);
  if (outcome.tee == TEEC_SUCCESS && outcome.error == KM_ERROR_VERIFICATION_FAILED) return false;
  run.require(outcome);
  return true;
}

verb_result verify(const std::string& folder, const operation_options& options,
                   const std::string& signature_file) {
  const bytes signature = read_file(signature_file, MAX_SIGNATURE_FILE);
  keymaster_device keymaster(folder);
  const opened_key key = open_key(&keymaster, options);
  if (!verify_input(&keymaster, options, key, signature)) {
    throw failure(
        "the signature is not this key's over this input",
        client::status{TEEC_SUCCESS, TEEC_ORIGIN_TRUSTED_APP, KM_ERROR_VERIFICATION_FAILED})
        .answering({{"key", options.key}, {"input", options.input}, {"verified", false}});
  }
  verb_result result;
  result.object = {{"key", options.key}, {"input", options.input}, {"verified", true}};
  result.text = "The signature is good\n";
  return result;
}

}  // namespace

void add_sign_verb(CLI::App* app, command_line* line) {
  CLI::App* verb = app->add_subcommand("sign", "Sign a file, or compute its MAC");
  auto options = std::make_shared<operation_options>();
  auto soter = std::make_shared<soter_sign_options>();
  options->add_key_and_input_to(verb, "What to sign");
  add_output(verb, "-o,--output", &options->output,
             "File for the signature's bytes (- for standard output); without it the signature is "
             "printed in hexadecimal. A SOTER key writes its document there");
  add_output(verb, "--signature", &soter->signature_file,
             "File for the signature over a SOTER key's document (default: FILE.sig)");
  add_number(verb, "--fingerprint", &soter->fid,
             "Report this fingerprint first, so that a SOTER key's document names it");
  options->add_mac_to(verb, "MAC length in bits (default: the digest's)");
  options->add_choices_to(verb);
  verb->callback(
      [=] { line->action = [=] { return sign(line->device_name(), *options, *soter); }; });

  verb = app->add_subcommand("verify", "Verify a signature, or a MAC");
  auto checked = std::make_shared<operation_options>();
  auto signature = std::make_shared<std::string>();
  checked->add_key_and_input_to(verb, "What was signed");
  add_input(verb, "--signature", signature.get(), "File with the signature's bytes")->required();
  checked->add_choices_to(verb);
  verb->callback(
      [=] { line->action = [=] { return verify(line->device_name(), *checked, *signature); }; });
}

}  // namespace kmtool
