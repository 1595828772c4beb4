// One operation with a key, from the command line: its options, its authentication, its stream.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "files.h"
#include "keymaster/client/operation.h"
#include "keymaster_device.h"
#include "options.h"
#include "tool.h"

namespace kmtool {

// What an operation may be told; each verb adds the options that it has.
struct operation_options {
  std::string key;
  std::string input = "-";
  std::string output;
  std::optional<uint32_t> digest;
  std::optional<uint32_t> padding;
  std::optional<uint32_t> mode;
  std::optional<uint32_t> mac_bits;
  std::string token_file;
  std::string authenticate;  // USER_ID[:TYPE]
  application_options application;

  void add_key_and_input_to(CLI::App* verb, const std::string& input_help);
  // Digest, padding, authentication and application.
  void add_choices_to(CLI::App* verb);
  void add_mac_to(CLI::App* verb, const std::string& help);
};

// The tokens of one operation: what goes with begin, and with every later command.
class operation_tokens {
 public:
  operation_tokens(const operation_options& options, const keymaster::client::param_set& key);

  // A key with a timeout wants its token at begin, where any challenge does.
  keymaster::client::param_set for_begin(const keymaster::client::context& tee) const;
  // A key without one wants it later, with the operation's handle as challenge.
  keymaster::client::param_set for_update(const keymaster::client::context& tee,
                                          uint32_t handle) const;
  // What to do when the TA says that the user has not authenticated.
  std::string advice() const;

 private:
  bool has_timeout_;
  bytes file_token_;
  std::optional<keymaster::client::token_request> user_;
};

// opened_key: a key file, and what its key is for.
struct opened_key {
  bytes blob;
  keymaster::client::param_set characteristics;

  uint64_t algorithm() const;
};
opened_key open_key(keymaster_device* keymaster, const operation_options& options);

// choose: what was asked for, else what the key allows: of several values the first of `preferred`
// that the key has, else the key's first. Nothing when the key has none either.
std::optional<uint64_t> choose(const std::optional<uint32_t>& asked,
                               const keymaster::client::param_set& key,
                               keymaster::keymaster_tag_t tag,
                               std::initializer_list<uint32_t> preferred = {});

// check_mac: throws failure (WRONG_USAGE) unless --mac was left out or asks for whole bytes of at
// most `longest` bits.
void check_mac(const std::optional<uint32_t>& bits, uint32_t longest);

using sink = std::function<void(byte_view)>;

// operation_run: an operation in progress. `action` ("sign") stands in messages.
class operation_run {
 public:
  operation_run(keymaster_device* keymaster, const operation_options& options,
                const opened_key& key, uint32_t purpose, keymaster::client::param_set params,
                const std::string& action);

  // Parameters that begin put out, such as a nonce.
  const keymaster::client::param_set& begun() const { return begun_; }

  void feed(byte_view data, const sink& to, const keymaster::client::param_set& extra = {});
  // The whole input, in bounded memory, with progress.
  void feed_file(input_file* input, const std::string& title, const sink& to);
  // What finish puts out goes to `to`; the outcome is for the caller to judge.
  keymaster::client::status finish(byte_view signature, const sink& to);

  void require(const keymaster::client::status& outcome) const;

 private:
  std::string action_;
  operation_tokens tokens_;
  keymaster::client::param_set begun_;
  std::unique_ptr<keymaster::client::operation> operation_;
  std::string advice_;      // on a failure without a name of its own
  bool puts_out_document_;  // which holds the whole message, escaped
  size_t fed_ = 0;          // bytes
  keymaster::client::param_set token_;
};

}  // namespace kmtool
