// kmtool attest | inspect
#include <memory>
#include <openssl/bio.h>
#include <openssl/err.h>
#include <openssl/evp.h>
#include <openssl/x509v3.h>

#include "attestation.h"
#include "files.h"
#include "keymaster/client/names.h"
#include "keymaster_device.h"
#include "listing.h"
#include "operands.h"
#include "tool.h"

namespace kmtool {

using namespace keymaster;

namespace {

constexpr size_t MAX_CHAIN_FILE = 4 * 1024 * 1024;

// The bytes as text when they are printable ASCII; otherwise nothing.
std::string printable(byte_view data) {
  for (const uint8_t byte : data) {
    if (byte < 0x20 || byte > 0x7E) return "";
  }
  return std::string(data.begin(), data.end());
}

std::string security_level_name(uint64_t level) {
  static constexpr const char* NAMES[] = {"software", "trusted environment", "strong box"};
  return level < std::size(NAMES) ? NAMES[level] : std::to_string(level);
}

std::string boot_state_name(uint64_t state) {
  static constexpr const char* NAMES[] = {"verified", "self-signed", "unverified", "failed"};
  return state < std::size(NAMES) ? NAMES[state] : std::to_string(state);
}

// Runs a libcrypto printer into a string.
template <class Print>
std::string printed(Print print) {
  const std::unique_ptr<BIO, int (*)(BIO*)> bio(BIO_new(BIO_s_mem()), BIO_free);
  if (!bio || print(bio.get()) < 0) return "?";
  char* text = nullptr;
  const long length = BIO_get_mem_data(bio.get(), &text);
  return std::string(text, static_cast<size_t>(length));
}

std::string name_text(const X509_NAME* name) {
  return printed([&](BIO* bio) { return X509_NAME_print_ex(bio, name, 0, XN_FLAG_ONELINE); });
}

std::string time_text(const ASN1_TIME* time) {
  return printed([&](BIO* bio) { return ASN1_TIME_print_ex(bio, time, ASN1_DTFLGS_ISO8601); });
}

std::string key_text(const X509* from) {
  const EVP_PKEY* key = X509_get0_pubkey(from);
  if (key == nullptr) {
    ERR_clear_error();
    return "unreadable";
  }
  const char* kind = EVP_PKEY_get0_type_name(key);
  return std::string(kind == nullptr ? "?" : kind) + ", " + std::to_string(EVP_PKEY_get_bits(key)) +
         " bits";
}

// Whether the next certificate's key, or for the last one its own, made the signature.
bool signed_by(const certificate& from, const certificate& by) {
  EVP_PKEY* key = X509_get0_pubkey(by.get());
  const bool good = key != nullptr && X509_verify(from.get(), key) == 1;
  ERR_clear_error();
  return good;
}

json root_to_json(const root_of_trust& root) {
  return {{"verified_boot_key", client::to_hex(root.verified_boot_key)},
          {"device_locked", root.device_locked},
          {"verified_boot_state", boot_state_name(root.verified_boot_state)}};
}

json list_to_json(const authorization_list& list) {
  json object = params_to_json(list.params);
  if (list.root) object["root_of_trust"] = root_to_json(*list.root);
  if (!list.unknown.empty()) object["unknown"] = list.unknown;
  return object;
}

json description_to_json(const key_description& found) {
  return {{"attestation_version", found.attestation_version},
          {"attestation_security_level", security_level_name(found.attestation_security_level)},
          {"keymaster_version", found.keymaster_version},
          {"keymaster_security_level", security_level_name(found.keymaster_security_level)},
          {"challenge", client::to_hex(found.challenge)},
          {"unique_id", client::to_hex(found.unique_id)},
          {"software_enforced", list_to_json(found.software_enforced)},
          {"tee_enforced", list_to_json(found.tee_enforced)}};
}

std::string list_text(const authorization_list& list) {
  table rows = list_params(list.params);
  const auto* application = list.params.find(KM_TAG_APPLICATION_ID);
  if (application != nullptr && !printable(application->data).empty()) {
    rows.row("application id as text", '"' + printable(application->data) + '"');
  }
  for (const uint32_t number : list.unknown)
    rows.row("[" + std::to_string(number) + "]", "unknown");
  std::string text = rows.text("      ");
  if (list.root) {
    text += "      root of trust\n";
    text += table()
                .row("verified boot key", client::to_hex(list.root->verified_boot_key))
                .row("device locked", list.root->device_locked ? "true" : "false")
                .row("boot state", boot_state_name(list.root->verified_boot_state))
                .text("        ");
  }
  return text.empty() ? "      (empty)\n" : text;
}

std::string description_text(const key_description& found) {
  const auto level = [](uint64_t version, uint64_t security) {
    return std::to_string(version) + ", " + security_level_name(security);
  };
  std::string text = "  key description\n";
  text +=
      table()
          .row("attestation", level(found.attestation_version, found.attestation_security_level))
          .row("keymaster", level(found.keymaster_version, found.keymaster_security_level))
          .row("challenge", found.challenge.empty() ? "(none)" : client::to_hex(found.challenge))
          .row("unique id", found.unique_id.empty() ? "(none)" : client::to_hex(found.unique_id))
          .text("    ");
  text += "    enforced by the TEE\n" + list_text(found.tee_enforced);
  text += "    enforced by software\n" + list_text(found.software_enforced);
  return text;
}

// Appends what there is to say of the certificate at `index` of the chain.
void describe(const std::vector<certificate>& chain, size_t index, verb_result* result) {
  const X509* from = chain[index].get();
  const bool last = index + 1 == chain.size();
  const bool good = signed_by(chain[index], last ? chain[index] : chain[index + 1]);
  const std::string signer = last ? "itself" : "the next certificate";
  const std::optional<key_description> found = find_key_description(from);
  json object = {{"subject", name_text(X509_get_subject_name(from))},
                 {"issuer", name_text(X509_get_issuer_name(from))},
                 {"not_before", time_text(X509_get0_notBefore(from))},
                 {"not_after", time_text(X509_get0_notAfter(from))},
                 {"key", key_text(from)},
                 {"signed_by_" + std::string(last ? "itself" : "next"), good}};
  result->text += "certificate " + std::to_string(index + 1) + "\n" +
                  table()
                      .row("subject", object["subject"])
                      .row("issuer", object["issuer"])
                      .row("valid", object["not_before"].get<std::string>() + " to " +
                                        object["not_after"].get<std::string>())
                      .row("public key", object["key"])
                      .row("signature", (good ? "made by " : "NOT made by ") + signer)
                      .text();
  if (found) {
    result->text += description_text(*found);
    object["key_description"] = description_to_json(*found);
  }
  result->object["certificates"].push_back(std::move(object));
}

verb_result inspect(const std::string& path) try {
  const std::vector<certificate> chain = parse_certificates(read_file(path, MAX_CHAIN_FILE));
  verb_result result;
  for (size_t i = 0; i < chain.size(); i++)
    describe(chain, i, &result);
  return result;
} catch (const attestation_error& error) {
  throw failure(WRONG_USAGE, path + ": " + error.what(),
                "It takes certificates in PEM, or one in DER.");
}

constexpr size_t MAX_CHALLENGE = 128;

bytes parse_challenge(const std::string& text) try {
  bytes challenge = client::from_hex(text);
  if (challenge.size() <= MAX_CHALLENGE) return challenge;
  throw failure(WRONG_USAGE, "--challenge: it has " + std::to_string(challenge.size()) +
                                 " bytes, and at most " + std::to_string(MAX_CHALLENGE) +
                                 " are taken");
} catch (const std::invalid_argument& error) {
  throw failure(WRONG_USAGE, "cannot read the challenge: " + std::string(error.what()));
}

struct attest_options {
  std::string key;
  std::string challenge;
  std::string output;  // empty: printed
};

verb_result attest(const std::string& folder, const attest_options& options) {
  const bytes blob = read_file(options.key);
  client::param_set params;
  params.add_bytes(KM_TAG_ATTESTATION_CHALLENGE, parse_challenge(options.challenge));
  keymaster_device keymaster(folder);
  const client::attest_result made = keymaster->attest_key(blob, params);
  require(made, "cannot attest the key");
  std::string pem;
  for (const certificate& link : chain_of(made.chain))
    pem += to_pem(link.get());
  verb_result result;
  result.object = {{"key", options.key}, {"certificates", made.value}};
  if (options.output.empty()) {
    result.object["chain"] = pem;
    result.text = pem;
  } else {
    write_file(options.output, {reinterpret_cast<const uint8_t*>(pem.data()), pem.size()},
               access::NORMAL);
    result.object["output"] = options.output;
    if (options.output != "-") {
      result.text = "Wrote a chain of " + std::to_string(made.value) + " certificates to " +
                    options.output + "\n";
    }
  }
  return result;
}

}  // namespace

void add_attest_verbs(CLI::App* app, command_line* line) {
  CLI::App* verb = app->add_subcommand("attest", "Have a key attested with a certificate chain");
  auto options = std::make_shared<attest_options>();
  add_input(verb, "KEY", &options->key, "File that holds the key blob")->required();
  verb->add_option("--challenge", options->challenge, "What the relying party asked for")
      ->required()
      ->type_name("HEX");
  add_output(verb, "-o,--output", &options->output,
             "File for the chain in PEM; without it, it is printed");
  verb->callback([=] { line->action = [=] { return attest(line->device_name(), *options); }; });

  verb = app->add_subcommand("inspect", "Show what an attestation certificate says");
  auto path = std::make_shared<std::string>();
  add_input(verb, "FILE", path.get(), "Certificates in PEM, or one in DER (- for standard input)")
      ->required();
  verb->callback([=] { line->action = [=] { return inspect(*path); }; });
}

}  // namespace kmtool
