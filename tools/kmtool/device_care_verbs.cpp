// kmtool device check | repair | backup | restore
#include <algorithm>

#include "listing.h"
#include "operands.h"
#include "product/uuids.h"
#include "tee/device/device.h"
#include "tee/device/uuid.h"
#include "tool.h"

namespace kmtool {

namespace {

using namespace std::string_view_literals;

// Objects that people know by other names, and what goes with them.
struct known_object {
  TEE_UUID ta;
  std::string_view id;
  const char* name;
  const char* loss;
};
constexpr known_object KNOWN[] = {
    {KEYMASTER_TA_UUID, "Keymaster KSK\0"sv, "key storage key",
     "every key that was made with replay-protected storage"},
    {KEYMASTER_TA_UUID, "SOTER_COUNTER_OBJECT\0"sv, "counter of SOTER documents",
     "the count: it begins at 1 again, and numbers that were given out are given out again"},
    {VAULT_TA_UUID, "Vault record\0"sv, "factory record",
     "the ATTK and the identifiers of the factory; the device can be provisioned anew"},
    {EARLIER_KEYMASTER_TA_UUID, "Blob key\0"sv, "key of the earlier Keymaster",
     "every blob of the earlier Keymaster on this device"},
};

std::string printable(const std::vector<uint8_t>& id) {
  std::string text;
  for (uint8_t byte : id)
    text += byte > 0x20 && byte < 0x7F ? static_cast<char>(byte) : '.';
  return text;
}

known_object describe(const tee::object_name& name) {
  for (const known_object& known : KNOWN) {
    if (tee::to_bytes(known.ta) == name.ta && std::ranges::equal(known.id, name.id)) return known;
  }
  return {tee::from_bytes(name.ta), "", "object", "what the trusted application kept there"};
}

verb_result list_damaged(const std::string& folder,
                         const std::vector<tee::damaged_object>& damaged) {
  verb_result result;
  result.object = {{"device", folder}, {"damaged", json::array()}};
  for (const auto& [name, fault] : damaged) {
    const known_object what = describe(name);
    const char* storage = name.storage == TEE_STORAGE_PRIVATE ? "private" : "replay-protected";
    const std::string ta = tee::to_text(what.ta);
    result.object["damaged"].push_back({{"object", what.name},
                                        {"id", printable(name.id)},
                                        {"trusted_application", ta},
                                        {"storage", storage},
                                        {"fault", fault},
                                        {"loss", what.loss}});
    result.text += std::string(what.name) + " (" + printable(name.id) + ")\n" +
                   table()
                       .row("fault", fault)
                       .row("of", ta)
                       .row("storage", storage)
                       .row("lost without it", what.loss)
                       .text();
  }
  return result;
}

verb_result check_device(const std::string& folder) {
  const auto damaged = tee::device::open(folder)->check();
  verb_result result = list_damaged(folder, damaged);
  if (damaged.empty()) {
    result.text = "All objects of the device pass their checks\n";
    return result;
  }
  result.code = TEE_FAILED;
  result.text +=
      "These are refused and kept. The right storage.db, or a backup, brings them back; 'kmtool "
      "device repair' gives them up.\n";
  return result;
}

verb_result repair_device(const std::string& folder, bool forget) {
  const auto device = tee::device::open(folder);
  const auto damaged = device->check();
  verb_result result = list_damaged(folder, damaged);
  if (damaged.empty()) {
    result.text = "There is nothing to repair\n";
  } else if (!forget) {
    result.code = REFUSED;
    result.text += "Nothing is changed. With --forget they are given up for good.\n";
  } else {
    for (const tee::damaged_object& object : damaged)
      device->forget(object.name);
    result.text += "These are given up; their names can be used again\n";
  }
  result.object["forgotten"] = forget;
  return result;
}

verb_result back_up_device(const std::string& folder, const std::string& file) {
  tee::device::backup(folder, file);
  verb_result result;
  result.object = {{"device", folder}, {"backup", file}};
  result.text = "Wrote the device to " + file +
                ". Whoever has this file has the device's keys.\nA device that is restored from "
                "it counts on from here: counters, limits and deletions of later are undone.\n";
  return result;
}

verb_result restore_device(const std::string& folder, const std::string& file) try {
  tee::device::restore(file, folder);
  verb_result result;
  result.object = {{"device", folder}, {"backup", file}};
  result.text = "Restored the device in " + folder + " as it was when " + file +
                " was made.\nCounters go on from there, so documents can repeat numbers that were "
                "given out since; what was deleted since is back.\nUse only one of the two if the "
                "first device still exists.\n";
  return result;
} catch (const tee::device_error& error) {
  using kind = tee::device_error::kind;
  if (error.reason() != kind::NOT_FOUND && error.reason() != kind::DAMAGED) throw;
  throw failure(WRONG_USAGE, error.what());
}

}  // namespace

void add_device_care_verbs(CLI::App* device_verb, command_line* line) {
  CLI::App* check = device_verb->add_subcommand(
      "check", "List the stored objects that fail their check and are refused");
  check->callback([=] { line->action = [=] { return check_device(line->device_folder()); }; });

  CLI::App* repair =
      device_verb->add_subcommand("repair", "Say what is lost with such objects, and give them up");
  auto forget = std::make_shared<bool>(false);
  repair->add_flag("--forget", *forget, "Give them up for good");
  repair->callback(
      [=] { line->action = [=] { return repair_device(line->device_folder(), *forget); }; });

  auto file = std::make_shared<std::string>();
  CLI::App* backup =
      device_verb->add_subcommand("backup", "Write all that the device is to a new file");
  add_output(backup, "file", file.get(), "The backup, as secret as the device")->required();
  backup->callback(
      [=] { line->action = [=] { return back_up_device(line->device_folder(), *file); }; });

  CLI::App* restore =
      device_verb->add_subcommand("restore", "Make a device's folder of such a file");
  add_input(restore, "file", file.get(), "The backup")->required();
  restore->callback(
      [=] { line->action = [=] { return restore_device(line->device_folder(), *file); }; });
}

}  // namespace kmtool
