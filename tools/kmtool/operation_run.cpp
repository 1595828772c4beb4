// Running one operation.
#include "operation_run.h"

#include <algorithm>

#include "keymaster/client/names.h"
#include "operands.h"
#include "progress.h"

namespace kmtool {

using namespace keymaster;
using client::param_set;

namespace {

constexpr size_t CHUNK = 64 * 1024;

constexpr char DOCUMENT_ADVICE[] =
    "A SOTER key signs UTF-8 text without zero bytes, with a digest, on a device that has its "
    "SOTER data ('kmtool soter check-attk').";

// Who authenticates for the operation, as --authenticate says.
client::token_request parse_user(const std::string& text) {
  size_t colon = text.find(':');
  std::optional<uint64_t> user = client::parse_number(text.substr(0, colon));
  client::token_request request;
  std::optional<uint32_t> type = request.type;
  if (colon != std::string::npos) {
    type = client::parse_value(KM_TAG_USER_AUTH_TYPE, text.substr(colon + 1));
  }
  if (!user || !type) {
    throw failure(WRONG_USAGE, "--authenticate: '" + text + "' is not USER_ID or USER_ID:TYPE",
                  "TYPE is one of: " + names_of(KM_TAG_USER_AUTH_TYPE) + ".");
  }
  request.user_id = *user;
  request.type = *type;
  return request;
}

// What a failure of an operation means that the TA has no code for; empty: nothing more is known.
std::string advice_on_failure(const opened_key& key, uint32_t purpose) {
  if (key.characteristics.contains(KM_TAG_SOTER_KEY)) return DOCUMENT_ADVICE;
  if (key.algorithm() != KM_ALGORITHM_RSA) return "";
  return purpose == KM_PURPOSE_DECRYPT
             ? "The input is no ciphertext of this key, or was made with another padding or digest."
             : "The input is too long for the key and its padding, or its number too large.";
}

param_set set_of(const bytes& token) {
  param_set params;
  if (!token.empty()) params.add_bytes(KM_TAG_AUTH_TOKEN, token);
  return params;
}

}  // namespace

void operation_options::add_key_and_input_to(CLI::App* verb, const std::string& input_help) {
  add_input(verb, "KEY", &key, "File that holds the key blob")->required();
  add_input(verb, "-i,--input", &input, input_help + ", - for standard input");
}

void operation_options::add_choices_to(CLI::App* verb) {
  add_name(verb, "--digest", KM_TAG_DIGEST, &digest, "Digest (default: the key's)");
  add_name(verb, "--padding", KM_TAG_PADDING, &padding, "Padding (default: the key's)");
  auto* token = add_input(verb, "--token", &token_file, "Authentication token to show");
  verb->add_option("--authenticate", authenticate,
                   "Have the device's authenticator vouch for this user, for this operation")
      ->type_name("USER_ID[:TYPE]")
      ->excludes(token);
  application.add_to(verb);
}

void operation_options::add_mac_to(CLI::App* verb, const std::string& help) {
  add_number(verb, "--mac", &mac_bits, help);
}

operation_tokens::operation_tokens(const operation_options& options, const param_set& key)
    : has_timeout_(key.contains(KM_TAG_AUTH_TIMEOUT)) {
  if (!options.token_file.empty()) file_token_ = read_file(options.token_file);
  if (!options.authenticate.empty()) user_ = parse_user(options.authenticate);
}

param_set operation_tokens::for_begin(const client::context& tee) const {
  if (user_ && has_timeout_) return set_of(issue_token(tee, *user_));
  return set_of(file_token_);
}

param_set operation_tokens::for_update(const client::context& tee, uint32_t handle) const {
  if (!user_ || has_timeout_) return set_of(file_token_);
  client::token_request request = *user_;
  request.challenge = handle;
  return set_of(issue_token(tee, request));
}

std::string operation_tokens::advice() const {
  if (user_ || !file_token_.empty()) {
    return has_timeout_ ? "The token must name the key's user and one of its authentication types."
                        : "The token must name the key's user, one of its authentication types "
                          "and this very operation: give --authenticate USER_ID[:TYPE].";
  }
  return has_timeout_ ? "The key's user must authenticate: make a token with 'kmtool token' and "
                        "give --token FILE, or give --authenticate USER_ID[:TYPE]."
                      : "The key's user must authenticate for each operation: give "
                        "--authenticate USER_ID[:TYPE].";
}

uint64_t opened_key::algorithm() const {
  return characteristics.number(KM_TAG_ALGORITHM).value_or(0);
}

opened_key open_key(keymaster_device* keymaster, const operation_options& options) {
  opened_key key;
  key.blob = read_file(options.key);
  auto asked = (*keymaster)->get_key_characteristics(key.blob, options.application.get());
  require_opened(keymaster->session(), options.key, key.blob, options.application.get(), asked);
  key.characteristics = std::move(asked.characteristics);
  return key;
}

std::optional<uint64_t> choose(const std::optional<uint32_t>& asked, const param_set& key,
                               keymaster_tag_t tag, std::initializer_list<uint32_t> preferred) {
  if (asked) return *asked;
  for (const uint32_t wanted : preferred) {
    for (const client::param& entry : key) {
      if (entry.tag == tag && entry.number == wanted) return wanted;
    }
  }
  return key.number(tag);
}

void check_mac(const std::optional<uint32_t>& bits, uint32_t longest) {
  if (!bits || (*bits % 8 == 0 && *bits > 0 && *bits <= longest)) return;
  throw failure(WRONG_USAGE, "--mac " + std::to_string(*bits) + ": it is a multiple of 8 up to " +
                                 std::to_string(longest) + " here");
}

operation_run::operation_run(keymaster_device* keymaster, const operation_options& options,
                             const opened_key& key, uint32_t purpose, param_set params,
                             const std::string& action)
    : action_("cannot " + action),
      tokens_(options, key.characteristics),
      advice_(advice_on_failure(key, purpose)),
      puts_out_document_(key.characteristics.contains(KM_TAG_SOTER_KEY)) {
  options.application.get().bind(&params);
  params.append(tokens_.for_begin(keymaster->context()));
  client::begin_result begun = (*keymaster)->begin(purpose, key.blob, params);
  require(begun);
  operation_ = std::make_unique<client::operation>(keymaster->session(), begun);
  begun_ = std::move(begun.params);
  token_ = tokens_.for_update(keymaster->context(), operation_->handle());
}

void operation_run::require(const client::status& outcome) const {
  if (outcome.ok()) return;
  if (outcome.error == KM_ERROR_KEY_USER_NOT_AUTHENTICATED) {
    throw failure(action_, outcome, tokens_.advice());
  }
  const bool nameless = outcome.error == KM_ERROR_UNKNOWN_ERROR;
  throw failure(action_, outcome, nameless ? advice_ : "");
}

void operation_run::feed(byte_view data, const sink& to, const param_set& extra) {
  param_set params = token_;
  params.append(extra);
  bytes output;
  require(operation_->update(data, &output, params));
  fed_ += data.size();
  if (!output.empty()) to(output);
}

void operation_run::feed_file(input_file* input, const std::string& title, const sink& to) {
  progress line(title, input->size());
  bytes chunk(CHUNK);
  while (size_t length = input->read(chunk)) {
    feed(byte_view(chunk).first(length), to);
    line.advance(length);
  }
}

client::status operation_run::finish(byte_view signature, const sink& to) {
  const size_t room = puts_out_document_ ? 2 * fed_ : 0;
  client::finish_result end = operation_->finish(signature, token_, room);
  if (end.ok() && !end.output.empty()) to(end.output);
  return end;
}

}  // namespace kmtool
