// kmtool help, and what was probably meant by a word that is none.
#include <algorithm>
#include <numeric>

#include "keymaster/client/names.h"
#include "keymaster/tags.h"
#include "listing.h"
#include "options.h"
#include "tool.h"

namespace kmtool {

using namespace keymaster;

namespace {

constexpr char TAGS[] = "tags";

const char* kind_of(keymaster_tag_t tag) {
  switch (tag_class(tag)) {
    case KM_ENUM:
    case KM_ENUM_REP:
      return "name";
    case KM_BOOL:
      return "true";
    case KM_DATE:
      return "date";
    case KM_BYTES:
    case KM_BIGNUM:
      return "text, or hex:...";
    default:
      return "number";
  }
}

// What --param takes.
std::string list_of_tags() {
  table rows;
  for (const keymaster_tag_t tag : client::all_tags()) {
    const std::string names = names_of(tag);
    rows.row(client::tag_name(tag), names.empty() ? kind_of(tag) : names);
  }
  return "Tags for --param TAG=VALUE, and their values\n" + rows.text();
}

// How many letters must be added, left out or changed to make one word of the other (Levenshtein).
size_t distance(std::string_view one, std::string_view other) {
  std::vector<size_t> row(other.size() + 1);
  std::iota(row.begin(), row.end(), size_t{0});
  for (size_t i = 0; i < one.size(); i++) {
    size_t before = row[0]++;
    for (size_t j = 0; j < other.size(); j++) {
      const size_t changed = before + (one[i] == other[j] ? 0 : 1);
      before = row[j + 1];
      row[j + 1] = std::min({changed, before + 1, row[j] + 1});
    }
  }
  return row.back();
}

std::vector<std::string> verbs_of(const CLI::App& app) {
  std::vector<std::string> verbs;
  for (const CLI::App* verb : app.get_subcommands([](const CLI::App*) { return true; }))
    verbs.push_back(verb->get_name());
  return verbs;
}

bool is_verb(const CLI::App& app, const std::string& word) {
  const std::vector<std::string> verbs = verbs_of(app);
  return std::ranges::find(verbs, word) != verbs.end();
}

verb_result help(CLI::App* app, const std::vector<std::string>& words) {
  verb_result result;
  if (words == std::vector<std::string>{TAGS}) {
    result.text = list_of_tags();
  } else {
    CLI::App* verb = app;
    std::string above;
    for (const std::string& word : words) {
      if (!is_verb(*verb, word)) throw unknown_verb(*verb, word);
      above += (above.empty() ? "" : " ") + verb->get_name();
      verb = verb->get_subcommand(word);
    }
    result.text = verb->help(above);
  }
  result.object = {{"help", result.text}};
  return result;
}

}  // namespace

std::string meant_instead(const std::string& word, const std::vector<std::string>& known) {
  constexpr size_t FARTHEST = 2;
  const auto nearest = std::ranges::min_element(
      known, {}, [&](const std::string& name) { return distance(word, name); });
  if (nearest == known.end() || distance(word, *nearest) > FARTHEST) return "";
  return "Did you mean '" + *nearest + "'?";
}

failure unknown_verb(const CLI::App& app, const std::string& word) {
  const std::string meant = meant_instead(word, verbs_of(app));
  return {WRONG_USAGE, "there is no verb '" + word + "'",
          meant.empty() ? "'kmtool help' lists them." : meant};
}

void add_help_verb(CLI::App* app, command_line* line) {
  CLI::App* verb = app->add_subcommand("help", "Tell about a verb, or list the 'tags' of --param");
  auto words = std::make_shared<std::vector<std::string>>();
  verb->add_option("VERB", *words, "The verb, or 'tags'")->type_name("");
  verb->callback([=] { line->action = [=] { return help(app, *words); }; });
}

}  // namespace kmtool
