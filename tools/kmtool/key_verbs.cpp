// kmtool generate | import | show | upgrade | delete
#include <filesystem>

#include "files.h"
#include "key_formats.h"
#include "key_options.h"
#include "keymaster/client/names.h"
#include "keymaster_device.h"
#include "listing.h"
#include "operands.h"
#include "tool.h"

namespace kmtool {

using namespace keymaster;

namespace {

// Options of the verbs that make keys or take one; each verb adds those that it has.
struct key_verb_options {
  std::string key;     // the file that is read
  std::string output;  // the file that is written
  bool force = false;
  key_options description;
  application_options application;

  void add_key_to(CLI::App* verb) {
    add_input(verb, "KEY", &key, "File that holds the key blob")->required();
  }
  void add_output_to(CLI::App* verb) {
    add_output(verb, "-o,--output", &output, "File for the key blob")->required();
    verb->add_flag("--force", force, "Overwrite a file that is there");
  }
  void add_description_to(CLI::App* verb) {
    verb->add_option_function<std::string>(
            "ALG",
            [this](const std::string& text) {
              description.algorithm = client::parse_value(KM_TAG_ALGORITHM, text);
              if (!description.algorithm) {
                throw CLI::ValidationError(
                    "ALG", "'" + text + "' is none of: " + names_of(KM_TAG_ALGORITHM));
              }
            },
            "Algorithm: " + names_of(KM_TAG_ALGORITHM))
        ->required();
    description.add_to(verb);
  }
};

verb_result stored(const std::string& what, const std::string& path, client::byte_view blob) {
  write_file(path, blob, access::PRIVATE);
  verb_result result;
  result.object = {{"key", path}, {"blob_bytes", blob.size()}};
  if (path != "-") {
    result.text = what + " in " + path + " (" + std::to_string(blob.size()) + " bytes)\n";
  }
  return result;
}

verb_result generate(const std::string& folder, const key_verb_options& options) {
  client::param_set description = describe_key(options.description, key_source::GENERATED);
  if (!options.force) refuse_overwriting(options.output);
  keymaster_device keymaster(folder);
  client::key_result made = keymaster->generate_key(description);
  require(made, "cannot generate the key");
  verb_result result = stored("Generated a key", options.output, made.blob);
  result.object["algorithm"] = client::value_name(KM_TAG_ALGORITHM, *options.description.algorithm);
  return result;
}

verb_result import(const std::string& folder, const key_verb_options& options) {
  client::param_set description = describe_key(options.description, key_source::IMPORTED);
  if (!options.force) refuse_overwriting(options.output);
  bytes content = read_file(options.key);
  bytes key_data = raw_key_data(*options.description.algorithm, options.key, content);
  keymaster_device keymaster(folder);
  client::key_result made = keymaster->import_key(description, key_data);
  require(made, "cannot import the key");
  verb_result result = stored("Imported the key", options.output, made.blob);
  result.object["characteristics"] = params_to_json(made.characteristics);
  return result;
}

verb_result show(const std::string& folder, const key_verb_options& options) {
  bytes blob = read_file(options.key);
  keymaster_device keymaster(folder);
  auto asked = keymaster->get_key_characteristics(blob, options.application.get());
  require_opened(keymaster.session(), options.key, blob, options.application.get(), asked);
  verb_result result;
  result.object = {{"key", options.key},
                   {"blob_bytes", blob.size()},
                   {"characteristics", params_to_json(asked.characteristics)}};
  result.text = list_params(asked.characteristics).text("");
  return result;
}

verb_result upgrade(const std::string& folder, const key_verb_options& options) {
  if (!options.force) refuse_overwriting(options.output, options.key);
  bytes blob = read_file(options.key);
  client::param_set params;
  options.application.get().bind(&params);
  keymaster_device keymaster(folder);
  client::key_result made = keymaster->upgrade_key(blob, params);
  require_own(options.key, made);
  require(made, "cannot upgrade the key");
  verb_result result = stored("Upgraded the key", options.output, made.blob);
  result.object["os_version"] = keymaster.settings().os_version;
  result.object["os_patchlevel"] = keymaster.settings().os_patchlevel;
  return result;
}

// Deleting asks nothing of a blob but its length, so a file of another kind would be lost. A blob
// that is outdated or bound to an application is still this device's.
void require_own_key(client::session* keymaster, const key_verb_options& options,
                     client::byte_view blob) {
  client::status asked = keymaster->get_key_characteristics(blob);
  client::status opened = asked;
  if (asked.error == KM_ERROR_KEY_REQUIRES_UPGRADE) opened = keymaster->upgrade_key(blob);
  if (opened.ok() || opened.error == KM_ERROR_INVALID_KEY_BLOB ||
      opened.error == KM_ERROR_INVALID_ARGUMENT) {
    return;
  }
  throw failure(options.key + " holds no key of this device", asked,
                "Give --force to delete the file all the same.");
}

verb_result remove(const std::string& folder, const key_verb_options& options) {
  bytes blob = read_file(options.key);
  keymaster_device keymaster(folder);
  if (!options.force) require_own_key(keymaster.session(), options, blob);
  require(keymaster->delete_key(blob), "cannot delete the key");
  if (options.key != "-") {
    std::error_code reason;
    std::filesystem::remove(options.key, reason);
    if (reason)
      throw failure(WRONG_USAGE, "cannot remove " + options.key + ": " + reason.message());
  }
  verb_result result;
  result.object = {{"key", options.key}, {"deleted", true}};
  result.text = "Deleted " + options.key + "; copies of the file would still work\n";
  return result;
}

using verb_function = verb_result (*)(const std::string& folder, const key_verb_options& options);

// Adds a verb that runs `function`; the result is for its options to be added.
std::pair<CLI::App*, std::shared_ptr<key_verb_options>> add_verb(CLI::App* app, command_line* line,
                                                                 const char* name, const char* help,
                                                                 verb_function function) {
  CLI::App* verb = app->add_subcommand(name, help);
  auto options = std::make_shared<key_verb_options>();
  verb->callback([=] { line->action = [=] { return function(line->device_name(), *options); }; });
  return {verb, options};
}

}  // namespace

void add_key_verbs(CLI::App* app, command_line* line) {
  {
    auto [verb, options] = add_verb(app, line, "generate", "Generate a key", generate);
    options->add_description_to(verb);
    options->description.soter.add_to(verb);
    options->add_output_to(verb);
  }
  {
    auto [verb, options] = add_verb(app, line, "import", "Import a key", import);
    options->add_description_to(verb);
    add_input(verb, "FILE", &options->key,
              "The key: raw bytes (hmac, aes), PEM or DER (rsa, ec); - for standard input")
        ->required();
    options->add_output_to(verb);
  }
  {
    auto [verb, options] = add_verb(app, line, "show", "Show a key's characteristics", show);
    options->add_key_to(verb);
    options->application.add_to(verb);
  }
  {
    auto [verb, options] =
        add_verb(app, line, "upgrade", "Bring a key up to the device's OS version", upgrade);
    options->add_key_to(verb);
    add_replacement(verb, "-o,--output", &options->output, "File for the key blob; KEY itself does")
        ->required();
    verb->add_flag("--force", options->force, "Overwrite another file that is there");
    options->application.add_to(verb);
  }
  {
    auto [verb, options] = add_verb(app, line, "delete", "Delete a key and its file", remove);
    options->add_key_to(verb);
    verb->add_flag("--force", options->force, "Delete a file that is no key of this device, too");
  }
}

}  // namespace kmtool
