// Provisioning of devices.
#include "soter_factory.h"

#include <algorithm>

#include "files.h"
#include "key_formats.h"
#include "keymaster_device.h"
#include "operands.h"
#include "tee/device/uuid.h"

namespace kmtool {

using namespace keymaster;

namespace {

constexpr uint32_t ATTK_BITS = 2048;
constexpr size_t MAX_SENSOR_TEXT = 128;
constexpr size_t MAX_CPU_ID = 64;
constexpr size_t MAX_DEVICE_ID = 128;

void add_text(CLI::App* verb, const std::string& name, std::string* target, size_t limit,
              const std::string& help) {
  auto fits = [limit](const std::string& text) -> std::string {
    if (!text.empty() && text.size() <= limit) return "";
    return "takes 1 to " + std::to_string(limit) + " bytes";
  };
  verb->add_option(name, *target, help)->type_name("TEXT")->check(fits);
}

client::rsa_numbers read_attk(const std::string& path) {
  client::rsa_numbers key =
      client::read_rsa_numbers(raw_key_data(KM_ALGORITHM_RSA, path, read_file(path)));
  if (key.n.size() != ATTK_BITS / 8 || key.n[0] < 0x80) {
    throw failure(WRONG_USAGE, path + ": the ATTK is an RSA key of 2048 bits",
                  "'openssl genpkey -algorithm RSA -pkeyopt rsa_keygen_bits:2048' makes one.");
  }
  return key;
}

}  // namespace

void factory_options::add_to(CLI::App* verb) {
  add_input(verb, "--attk", &attk_file,
            "Device key for SOTER, an RSA-2048 private key in PEM or DER (default: a fresh one)");
  add_text(verb, "--fp-name", &fingerprint_name, MAX_SENSOR_TEXT, "Name of the fingerprint sensor");
  add_text(verb, "--fp-version", &fingerprint_version, MAX_SENSOR_TEXT, "Version of the sensor");
  add_text(verb, "--cpu-id", &cpu_id, MAX_CPU_ID,
           "CPU id (default: made of the device's public id)");
  add_text(verb, "--device-id", &device_id, MAX_DEVICE_ID,
           "Identifier that SOTER gives out (default: the device's public id)");
}

client::factory_data factory_options::data(const tee::device_settings& settings) const {
  const std::string id = tee::to_text(settings.public_id);
  client::factory_data made;
  made.attk = attk_file.empty() ? client::read_rsa_numbers(new_rsa_key_data(ATTK_BITS))
                                : read_attk(attk_file);
  made.fingerprint_name = fingerprint_name;
  made.fingerprint_version = fingerprint_version;
  made.device_id = device_id.empty() ? id : device_id;
  made.cpu_id = cpu_id;
  if (cpu_id.empty()) std::ranges::remove_copy(id, std::back_inserter(made.cpu_id), '-');
  return made;
}

void provision(const std::string& folder, const client::factory_data& data) try {
  const client::status outcome = client::vault(open_device(folder)).provision(data);
  if (outcome.tee == TEEC_ERROR_ACCESS_CONFLICT) {
    throw failure(REFUSED, "the device in " + folder + " has been provisioned before",
                  "What the factory gave a device stays; make another device.");
  }
  require(outcome, "cannot provision the device");
} catch (const client::open_error& error) {
  throw session_failure("vault", error);
}

}  // namespace kmtool
