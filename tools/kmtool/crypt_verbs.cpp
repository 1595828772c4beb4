// kmtool encrypt | decrypt
#include "keymaster/client/names.h"
#include "operands.h"
#include "operation_run.h"
#include "output_file.h"

namespace kmtool {

using namespace keymaster;
using client::param_set;

namespace {

constexpr uint32_t DEFAULT_TAG_BITS = 128;
constexpr uint32_t MAX_TAG_BITS = 128;
constexpr size_t GCM_NONCE_SIZE = 12;
constexpr size_t BLOCK_NONCE_SIZE = 16;
constexpr size_t MAX_AAD_FILE = 16 * 1024 * 1024;

struct crypt_options : operation_options {
  std::optional<std::string> nonce;  // hexadecimal
  std::string aad_file;
};

// How the key will be used: all that begin must be told, but the nonce.
struct crypt_plan {
  param_set params;
  size_t nonce_size = 0;  // 0: the mode takes none
  bool authenticated = false;
};

crypt_plan plan_aes(const crypt_options& options, const param_set& key) {
  crypt_plan plan;
  const std::optional<uint64_t> mode =
      choose(options.mode, key, KM_TAG_BLOCK_MODE, {KM_MODE_GCM, KM_MODE_CBC, KM_MODE_CTR});
  if (!mode) throw failure(WRONG_USAGE, "the key allows no block mode");
  const bool padded = *mode == KM_MODE_ECB || *mode == KM_MODE_CBC;
  const std::optional<uint64_t> padding =
      padded ? choose(options.padding, key, KM_TAG_PADDING, {KM_PAD_PKCS7})
             : std::optional<uint64_t>(options.padding.value_or(KM_PAD_NONE));
  plan.params.add(KM_TAG_BLOCK_MODE, *mode);
  if (padding) plan.params.add(KM_TAG_PADDING, *padding);
  plan.authenticated = *mode == KM_MODE_GCM;
  if (plan.authenticated) {
    check_mac(options.mac_bits, MAX_TAG_BITS);
    plan.params.add(KM_TAG_MAC_LENGTH, options.mac_bits.value_or(DEFAULT_TAG_BITS));
  } else if (options.mac_bits) {
    throw failure(WRONG_USAGE, "--mac: only GCM has a tag");
  }
  plan.nonce_size = plan.authenticated     ? GCM_NONCE_SIZE
                    : *mode == KM_MODE_ECB ? 0
                                           : BLOCK_NONCE_SIZE;
  return plan;
}

crypt_plan plan_rsa(const crypt_options& options, const param_set& key) {
  crypt_plan plan;
  const std::optional<uint64_t> padding =
      choose(options.padding, key, KM_TAG_PADDING,
             {KM_PAD_RSA_OAEP, KM_PAD_RSA_PKCS1_1_5_ENCRYPT, KM_PAD_NONE});
  if (padding) plan.params.add(KM_TAG_PADDING, *padding);
  if (padding == KM_PAD_RSA_OAEP || options.digest) {
    const std::optional<uint64_t> digest =
        choose(options.digest, key, KM_TAG_DIGEST, {KM_DIGEST_SHA_2_256});
    if (digest) plan.params.add(KM_TAG_DIGEST, *digest);
  }
  return plan;
}

crypt_plan make_plan(const crypt_options& options, const opened_key& key) {
  switch (key.algorithm()) {
    case KM_ALGORITHM_AES:
      return plan_aes(options, key.characteristics);
    case KM_ALGORITHM_RSA:
      return plan_rsa(options, key.characteristics);
    default:
      throw failure(WRONG_USAGE, "only AES and RSA keys encrypt",
                    "'kmtool show' tells what a key is for.");
  }
}

bytes parse_nonce(const std::string& text) try {
  return client::from_hex(text);
} catch (const std::invalid_argument& error) {
  throw failure(WRONG_USAGE, "cannot read the nonce: " + std::string(error.what()));
}

void feed_aad(operation_run* run, const crypt_options& options, const crypt_plan& plan) {
  if (options.aad_file.empty()) return;
  if (!plan.authenticated) throw failure(WRONG_USAGE, "--aad: only GCM authenticates other data");
  param_set extra;
  extra.add_bytes(KM_TAG_ASSOCIATED_DATA, read_file(options.aad_file, MAX_AAD_FILE));
  run->feed(
      {}, [](byte_view) {}, extra);
}

// The nonce stands in front of the ciphertext unless the caller gave one and keeps it.
void encrypt_stream(keymaster_device* keymaster, const crypt_options& options,
                    const opened_key& key, input_file* input, output_file* output) {
  crypt_plan plan = make_plan(options, key);
  if (options.nonce) plan.params.add_bytes(KM_TAG_NONCE, parse_nonce(*options.nonce));
  operation_run run(keymaster, options, key, KM_PURPOSE_ENCRYPT, plan.params, "encrypt");
  const client::param* nonce = run.begun().find(KM_TAG_NONCE);
  if (nonce != nullptr && !options.nonce) output->write(nonce->data);
  const sink write = [&](byte_view data) { output->write(data); };
  feed_aad(&run, options, plan);
  run.feed_file(input, "Encrypting", write);
  run.require(run.finish({}, write));
}

void decrypt_stream(keymaster_device* keymaster, const crypt_options& options,
                    const opened_key& key, input_file* input, output_file* output) {
  crypt_plan plan = make_plan(options, key);
  if (options.nonce) {
    plan.params.add_bytes(KM_TAG_NONCE, parse_nonce(*options.nonce));
  } else if (plan.nonce_size != 0) {
    bytes nonce(plan.nonce_size);
    if (input->read(nonce) != nonce.size()) {
      throw failure(WRONG_USAGE, "the input is shorter than its nonce");
    }
    plan.params.add_bytes(KM_TAG_NONCE, nonce);
  }
  operation_run run(keymaster, options, key, KM_PURPOSE_DECRYPT, plan.params, "decrypt");
  const sink write = [&](byte_view data) { output->write(data); };
  feed_aad(&run, options, plan);
  run.feed_file(input, "Decrypting", write);
  run.require(run.finish({}, write));
}

using stream_function = void (*)(keymaster_device*, const crypt_options&, const opened_key&,
                                 input_file*, output_file*);

// The output appears only when everything has succeeded: what GCM decrypts is not authenticated
// before its end.
verb_result crypt(const std::string& folder, const crypt_options& options, stream_function stream,
                  access made, const std::string& done) {
  keymaster_device keymaster(folder);
  const opened_key key = open_key(&keymaster, options);
  input_file input(options.input);
  output_file output(options.output, made);
  stream(&keymaster, options, key, &input, &output);
  output.commit();
  verb_result result;
  result.object = {{"key", options.key},
                   {"input", options.input},
                   {"output", options.output},
                   {"bytes", output.written()}};
  if (options.output != "-") {
    result.text = done + " " + (options.input == "-" ? "standard input" : options.input) + "; " +
                  std::to_string(output.written()) + " bytes in " + options.output + "\n";
  }
  return result;
}

void add_crypt_verb(CLI::App* app, command_line* line, const char* name, const char* help,
                    stream_function stream, access made, const char* done) {
  CLI::App* verb = app->add_subcommand(name, help);
  auto options = std::make_shared<crypt_options>();
  options->output = "-";
  options->add_key_and_input_to(verb, std::string("What to ") + name);
  add_output(verb, "-o,--output", &options->output, "File for the result, - for standard output");
  add_name(verb, "--mode", KM_TAG_BLOCK_MODE, &options->mode, "Block mode (default: the key's)");
  verb->add_option("--nonce", options->nonce,
                   "Nonce; without it, it stands in front of the "
                   "ciphertext")
      ->type_name("HEX");
  add_input(verb, "--aad", &options->aad_file, "Data that GCM authenticates, too");
  options->add_mac_to(verb, "GCM tag length in bits (default: 128)");
  options->add_choices_to(verb);
  verb->callback([=] {
    line->action = [=] { return crypt(line->device_name(), *options, stream, made, done); };
  });
}

}  // namespace

void add_crypt_verbs(CLI::App* app, command_line* line) {
  add_crypt_verb(app, line, "encrypt", "Encrypt a file", encrypt_stream, access::NORMAL,
                 "Encrypted");
  add_crypt_verb(app, line, "decrypt", "Decrypt a file", decrypt_stream, access::PRIVATE,
                 "Decrypted");
}

}  // namespace kmtool
