// kmtool device create | provision | show | set | reboot | stop
#include <array>
#include <ctime>

#include "listing.h"
#include "options.h"
#include "soter_factory.h"
#include "tee/device/device.h"
#include "tee/device/uuid.h"
#include "tee/wire/connect.h"
#include "tool.h"

namespace kmtool {

namespace {

struct device_options {
  bool no_rpmb = false;
  std::string id;
  std::optional<uint32_t> os_version;
  std::optional<uint32_t> os_patchlevel;
  factory_options factory;

  void add_versions_to(CLI::App* verb) {
    add_number(verb, "--os-version", &os_version, "OS version, decimal MMmmss: 120000 is 12.0.0");
    add_number(verb, "--os-patchlevel", &os_patchlevel, "Patch level, decimal YYYYMM");
  }
  void apply_versions_to(tee::device_settings* settings) const {
    settings->os_version = os_version.value_or(settings->os_version);
    settings->os_patchlevel = os_patchlevel.value_or(settings->os_patchlevel);
  }
};

verb_result describe(const std::string& title, const std::string& folder,
                     const tee::device_settings& settings) {
  verb_result result;
  result.object = {{"device", folder},
                   {"id", tee::to_text(settings.public_id)},
                   {"manufacturer", settings.manufacturer},
                   {"implementation_version", settings.implementation_version},
                   {"rpmb", settings.rpmb},
                   {"os_version", settings.os_version},
                   {"os_patchlevel", settings.os_patchlevel}};
  table lines;
  lines.row("folder", folder)
      .row("id", tee::to_text(settings.public_id))
      .row("manufacturer", settings.manufacturer)
      .row("implementation", settings.implementation_version)
      .row("RPMB storage", settings.rpmb ? "yes" : "no")
      .row("OS version", std::to_string(settings.os_version))
      .row("OS patch level", std::to_string(settings.os_patchlevel));
  result.text = title + "\n" + lines.text();
  return result;
}

verb_result create_device(const std::string& folder, const device_options& options) {
  tee::device_settings settings;
  settings.rpmb = !options.no_rpmb;
  options.apply_versions_to(&settings);
  if (options.id.empty()) {
    settings.identity = tee::new_uuid();
  } else if (!tee::parse_uuid(options.id, &settings.identity)) {
    throw failure(WRONG_USAGE, "--id: '" + options.id + "' is not a UUID",
                  "Its form is 00000000-0000-0000-0000-000000000000.");
  }
  settings.public_id = tee::public_id_of(settings.identity);
  const keymaster::client::factory_data data = options.factory.data(settings);
  tee::device::create(folder, settings);
  provision(folder, data);
  return describe("Created the device", folder, settings);
}

verb_result provision_device(const std::string& folder, const device_options& options) {
  const tee::device_settings settings = tee::device::read_settings(folder);
  provision(folder, options.factory.data(settings));
  return describe("Provisioned the device", folder, settings);
}

verb_result set_versions(const std::string& folder, const device_options& options) {
  tee::device_settings settings = tee::device::read_settings(folder);
  options.apply_versions_to(&settings);
  tee::device::write_settings(folder, settings);
  return describe("The device is now", folder, settings);
}

// The time as ISO 8601 has it, UTC.
std::string utc(time_t time) {
  std::array<char, 32> text{};
  std::tm parts{};
  gmtime_r(&time, &parts);
  return {text.data(), std::strftime(text.data(), text.size(), "%Y-%m-%dT%H:%M:%SZ", &parts)};
}

verb_result show_device(const std::string& folder) {
  verb_result result = describe("The device", folder, tee::device::read_settings(folder));
  const auto service = tee::wire::find_service(folder);
  if (!service) return result;
  result.object["served_by"] = {{"process", service->process}, {"since", utc(service->since)}};
  table line;
  line.row("served by",
           "process " + std::to_string(service->process) + " since " + utc(service->since));
  result.text += line.text();
  return result;
}

void stop(const std::string& folder) {
  if (!tee::wire::stop_service(folder))
    throw failure(TEE_FAILED, "the service of the device in " + folder + " does not end");
}

verb_result stop_device(const std::string& folder) {
  tee::device::read_settings(folder);  // or throws
  const bool served = tee::wire::is_served(folder);
  stop(folder);
  verb_result result;
  result.object = {{"device", folder}, {"stopped", served}};
  result.text = served ? "Nobody serves the device any more\n" : "Nobody serves the device\n";
  return result;
}

// What is in the service's memory ends with the boot, so the service may end, too.
verb_result reboot_device(const std::string& folder) {
  stop(folder);
  tee::device::reboot(folder);
  verb_result result;
  result.object = {{"device", folder}, {"rebooted", true}};
  result.text = "Rebooted the device; tokens of the earlier boot are void\n";
  return result;
}

}  // namespace

void add_device_verbs(CLI::App* app, command_line* line) {
  CLI::App* verb = app->add_subcommand("device", "Create and administer a device");
  auto options = std::make_shared<device_options>();

  CLI::App* create = verb->add_subcommand("create", "Create the device's folder and provision it");
  create->add_flag("--no-rpmb", options->no_rpmb, "A device without replay-protected storage");
  create
      ->add_option(
          "--id", options->id,
          "The device's identity, which is secret and is not shown again (default: a random "
          "one)")
      ->type_name("UUID");
  options->add_versions_to(create);
  options->factory.add_to(create);
  create->callback(
      [=] { line->action = [=] { return create_device(line->device_folder(), *options); }; });

  CLI::App* provision = verb->add_subcommand(
      "provision", "Give a device that has none its SOTER key and properties, as create does");
  options->factory.add_to(provision);
  provision->callback(
      [=] { line->action = [=] { return provision_device(line->device_folder(), *options); }; });

  CLI::App* show = verb->add_subcommand("show", "Show the device's settings");
  show->callback([=] { line->action = [=] { return show_device(line->device_folder()); }; });

  CLI::App* set = verb->add_subcommand("set", "Change the OS version and patch level");
  options->add_versions_to(set);
  set->callback(
      [=] { line->action = [=] { return set_versions(line->device_folder(), *options); }; });

  CLI::App* reboot = verb->add_subcommand("reboot", "Start a new boot of the device");
  reboot->callback([=] { line->action = [=] { return reboot_device(line->device_folder()); }; });

  CLI::App* stop = verb->add_subcommand("stop", "End the process that serves the device, if any");
  stop->callback([=] { line->action = [=] { return stop_device(line->device_folder()); }; });
  add_device_care_verbs(verb, line);
}

}  // namespace kmtool
