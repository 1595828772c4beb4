// kmtool token
#include "files.h"
#include "keymaster_device.h"
#include "operands.h"
#include "options.h"
#include "tool.h"

namespace kmtool {

using namespace keymaster;

namespace {

struct token_options {
  std::optional<uint64_t> user_id;
  std::optional<uint64_t> authenticator_id;
  std::optional<uint32_t> type;
  std::optional<uint64_t> challenge;
  std::string output;
};

verb_result make_token(const std::string& folder, const token_options& options) {
  client::token_request request;
  request.user_id = options.user_id.value_or(0);
  request.authenticator_id = options.authenticator_id.value_or(0);
  request.type = options.type.value_or(KM_AUTH_TYPE_PASSWORD);
  request.challenge = options.challenge.value_or(0);
  bytes token = issue_token(open_device(folder), request);
  write_file(options.output, token, access::PRIVATE);
  verb_result result;
  result.object = {{"token", options.output}, {"user_id", request.user_id}};
  if (options.output != "-") {
    result.text = "Issued a token in " + options.output + ", valid until the next reboot\n";
  }
  return result;
}

}  // namespace

void add_token_verb(CLI::App* app, command_line* line) {
  CLI::App* verb = app->add_subcommand("token", "Have the device's authenticator vouch for a user");
  auto options = std::make_shared<token_options>();
  add_number(verb, "--user-id", &options->user_id, "Who authenticated")->required();
  add_number(verb, "--authenticator-id", &options->authenticator_id, "By which authenticator");
  add_name(verb, "--type", KM_TAG_USER_AUTH_TYPE, &options->type, "How (default: password)");
  add_number(verb, "--challenge", &options->challenge, "For which operation (default: 0, none)");
  add_output(verb, "-o,--output", &options->output, "File for the token")->required();
  verb->callback([=] { line->action = [=] { return make_token(line->device_name(), *options); }; });
}

}  // namespace kmtool
