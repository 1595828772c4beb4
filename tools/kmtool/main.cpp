// kmtool: creates devices, makes keys and uses them. The one place where results and failures are
// printed and become exit codes.
#include <algorithm>
#include <cstdlib>
#include <exception>
#include <iostream>
#include <new>
#include <utility>
#include <vector>

#include "files.h"
#include "operands.h"
#include "options.h"
#include "tee/device/device.h"
#include "tee/wire/connect.h"
#include "tool.h"

namespace kmtool {

namespace client = keymaster::client;

failure::failure(exit_code code, const std::string& message, std::string advice)
    : std::runtime_error(message), code_(code), advice_(std::move(advice)) {}

failure::failure(const std::string& action, const client::status& outcome,
                 const std::string& advice)
    : std::runtime_error(action + ": " + outcome.text()),
      code_(outcome.tee == TEEC_SUCCESS ? REFUSED : TEE_FAILED),
      advice_(advice.empty() ? std::string(outcome.advice()) : advice),
      outcome_(outcome) {}

failure failure::answering(json object) && {
  answer_ = std::move(object);
  return std::move(*this);
}

std::string command_line::device_name() const {
  return device.empty() ? tee::device::default_path() : device;
}

std::string command_line::device_folder() const {
  return std::string(tee::wire::folder_of(device_name()));
}

namespace {

void print_json(const json& object) {
  // A file name need not be UTF-8.
  std::cout << object.dump(2, ' ', false, json::error_handler_t::replace) << "\n";
}

json to_json(const failure& error) {
  json object = {{"message", error.what()}, {"exit_code", error.code()}};
  if (!error.advice().empty()) object["advice"] = error.advice();
  if (error.outcome()) {
    const client::status& outcome = *error.outcome();
    object["keymaster_error"] = {{"name", client::error_name(outcome.error)},
                                 {"number", outcome.error}};
    object["tee_result"] = {{"name", client::tee_name(outcome.tee)}, {"number", outcome.tee}};
  }
  return {{"error", std::move(object)}};
}

// Of these the trace alone tells what happened.
bool is_nameless(const client::status& outcome) {
  return outcome.tee != TEEC_SUCCESS || outcome.error == keymaster::KM_ERROR_UNKNOWN_ERROR;
}

bool traces_nothing() {
  return std::string(getenv("TEE_TRACE_LEVEL")) == "0";
}

int report(const failure& error, bool as_json) {
  if (as_json) print_json(error.answer() ? *error.answer() : to_json(error));
  std::cerr << "kmtool: " << error.what() << "\n";
  if (!error.advice().empty()) std::cerr << error.advice() << "\n";
  if (error.outcome() && is_nameless(*error.outcome()) && traces_nothing())
    std::cerr << "With -v the device's trace tells more.\n";
  return error.code();
}

failure from_device_error(const tee::device_error& error) {
  using kind = tee::device_error::kind;
  switch (error.reason()) {
    case kind::NOT_FOUND:
      return {WRONG_USAGE, error.what(), "Make one with 'kmtool device create'."};
    case kind::EXISTS:
      return {WRONG_USAGE, error.what()};
    case kind::DAMAGED:
      return {TEE_FAILED, error.what(),
              "Put the right file back, or make the device anew from a backup with 'kmtool device "
              "restore'."};
    default:
      return {TEE_FAILED, error.what()};
  }
}

// Runs the verb; every exception becomes a failure.
verb_result run(const command_line& line) try {
  return line.action();
} catch (const tee::device_error& error) {
  throw from_device_error(error);
} catch (const client::open_error& error) {
  throw failure("cannot reach the TEE", error.reason());
} catch (const std::bad_alloc&) {
  throw failure(TEE_FAILED, "out of memory");
} catch (const failure&) {
  throw;
} catch (const std::exception& error) {
  throw failure(TEE_FAILED, error.what());
}

void print_result(const verb_result& result, bool as_json) {
  if (as_json) {
    print_json(result.object);
  } else {
    std::cout << result.text;
  }
  std::cout.flush();
  if (!std::cout) throw failure(WRONG_USAGE, "cannot write standard output");
}

void set_trace(const std::string& level) {
  setenv("TEE_TRACE_LEVEL", level.c_str(), 1);
}

void add_global_options(CLI::App* app, command_line* line) {
  app->add_option("--device", line->device,
                  "Folder of the device (default: $KEYMASTER_DEVICE, else below "
                  "$XDG_STATE_HOME or ~/.local/state); teed:DIR: served by a process of its own")
      ->type_name("DIR")
      ->check([](const std::string& path) -> std::string {
        return tee::wire::folder_of(path).empty() ? "the path is empty" : "";
      });
  app->add_flag("--json", line->as_json, "Print one JSON object on standard output");
  app->add_option_function<std::string>(
         "--trace", set_trace,
         "Trace to standard error: 0 none (default), 1 errors, 2 info, 3 debug, 4 flow")
      ->check(CLI::IsMember({"0", "1", "2", "3", "4"}))
      ->type_name("LEVEL");
  app->add_flag_callback(
      "-v,--verbose", [] { set_trace("1"); }, "Trace errors, as --trace 1");
  app->set_version_flag("--version", "kmtool " KMTOOL_VERSION);
}

// The first word that was left over where a verb was wanted.
std::optional<failure> first_unknown(const CLI::App& app) {
  const CLI::App* verb = &app;
  while (!verb->get_subcommands().empty())
    verb = verb->get_subcommands().front();
  const bool has_verbs = !verb->get_subcommands([](const CLI::App*) { return true; }).empty();
  for (const std::string& word : app.remaining(true)) {
    if (has_verbs && !word.starts_with('-')) return unknown_verb(*verb, word);
  }
  return std::nullopt;
}

// The command line, last word first, as the parser wants it. Verbs behind "help" are not to be run.
std::vector<std::string> words_of(int argc, char** argv) {
  std::vector<std::string> words(argv + 1, argv + argc);
  const auto verb =
      std::ranges::find_if(words, [](const std::string& word) { return !word.starts_with('-'); });
  if (verb != words.end() && *verb == "help") words.insert(verb + 1, "--");
  std::ranges::reverse(words);
  return words;
}

int run_command_line(int argc, char** argv) {
  CLI::App app("Keys in a trusted execution environment: make them, use them, look at them.",
               "kmtool");
  command_line line;
  app.fallthrough();
  app.option_defaults()->always_capture_default();
  setenv("TEE_TRACE_LEVEL", "0", 0);  // a program's TEE tells errors, the tool tells them itself
  add_global_options(&app, &line);
  add_device_verbs(&app, &line);
  add_key_verbs(&app, &line);
  add_export_verb(&app, &line);
  add_sign_verb(&app, &line);
  add_crypt_verbs(&app, &line);
  add_token_verb(&app, &line);
  add_attest_verbs(&app, &line);
  add_soter_verbs(&app, &line);
  add_demo_verb(&app, &line);
  add_help_verb(&app, &line);
  try {
    app.parse(words_of(argc, argv));
    if (!line.action) throw failure(WRONG_USAGE, "no verb is given", "'kmtool --help' lists them.");
    check_operands(app, line.as_json);
    const verb_result result = run(line);
    print_result(result, line.as_json);
    return result.code;
  } catch (const CLI::ParseError& error) {
    if (error.get_exit_code() == 0) return app.exit(error);  // help
    if (const auto unknown = first_unknown(app)) return report(*unknown, line.as_json);
    return report({WRONG_USAGE, error.what(), "'kmtool VERB --help' tells what it takes."},
                  line.as_json);
  } catch (const failure& error) {
    return report(error, line.as_json);
  }
}

}  // namespace
}  // namespace kmtool

int main(int argc, char** argv) try {
  kmtool::open_standard_streams();
  kmtool::leave_nothing_behind();
  return kmtool::run_command_line(argc, argv);
} catch (const std::exception& error) {
  // What failed while a failure was reported.
  fprintf(stderr, "kmtool: %s\n", error.what());
  return kmtool::TEE_FAILED;
}
