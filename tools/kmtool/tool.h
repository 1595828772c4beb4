// What the verbs share: the options of every call, results, failures and exit codes.
#pragma once

#include <CLI/CLI.hpp>
#include <functional>
#include <nlohmann/json.hpp>
#include <optional>
#include <stdexcept>
#include <string>
#include <vector>

#include "keymaster/client/status.h"

namespace kmtool {

using json = nlohmann::ordered_json;

enum exit_code : int { DONE = 0, REFUSED = 1, WRONG_USAGE = 2, TEE_FAILED = 3 };

// A call that cannot be carried out: the exit code, what happened, and what to do about it.
class failure : public std::runtime_error {
 public:
  failure(exit_code code, const std::string& message, std::string advice = "");

  // What the trusted application answered to `action` ("cannot generate the key"): REFUSED when it
  // is a Keymaster error alone, TEE_FAILED when the TEE failed.
  failure(const std::string& action, const keymaster::client::status& outcome,
          const std::string& advice = "");

  // answering: what --json prints in place of an error object, where the failure is the answer.
  failure answering(json object) &&;

  const std::optional<json>& answer() const { return answer_; }
  exit_code code() const { return code_; }
  const std::string& advice() const { return advice_; }
  const std::optional<keymaster::client::status>& outcome() const { return outcome_; }

 private:
  exit_code code_;
  std::string advice_;
  std::optional<keymaster::client::status> outcome_;
  std::optional<json> answer_;
};

// require: throws failure unless the outcome is ok.
inline void require(const keymaster::client::status& outcome, const std::string& action) {
  if (!outcome.ok()) throw failure(action, outcome);
}

// What a verb has to say: the object for --json, text for people (empty: nothing), and the code to
// exit with.
struct verb_result {
  json object = json::object();
  std::string text;
  exit_code code = DONE;
};

// The command line as parsed: options of every call, and what the chosen verb will do.
struct command_line {
  std::string device;  // as named; empty: the default one
  bool as_json = false;
  std::function<verb_result()> action;

  // device_name: the device as the client API takes it; may say that it is served. device_folder:
  // where it lies.
  std::string device_name() const;
  std::string device_folder() const;
};

// Each adds its verbs to the application; their actions refer to `line`, which must outlive them.
void add_device_verbs(CLI::App* app, command_line* line);
void add_device_care_verbs(CLI::App* device_verb, command_line* line);
void add_key_verbs(CLI::App* app, command_line* line);
void add_crypt_verbs(CLI::App* app, command_line* line);
void add_export_verb(CLI::App* app, command_line* line);
void add_sign_verb(CLI::App* app, command_line* line);
void add_token_verb(CLI::App* app, command_line* line);
void add_attest_verbs(CLI::App* app, command_line* line);
void add_soter_verbs(CLI::App* app, command_line* line);
void add_demo_verb(CLI::App* app, command_line* line);
void add_help_verb(CLI::App* app, command_line* line);

// unknown_verb: that `app` has no verb of that name, with the one that was probably meant.
failure unknown_verb(const CLI::App& app, const std::string& word);

// meant_instead: "Did you mean '...'?" when a known name is close to `word`; else empty.
std::string meant_instead(const std::string& word, const std::vector<std::string>& known);

}  // namespace kmtool
