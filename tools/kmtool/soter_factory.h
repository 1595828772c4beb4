// What the factory gives a device for SOTER.
#pragma once

#include <string>

#include "keymaster/client/vault.h"
#include "tee/device/device.h"
#include "tool.h"

namespace kmtool {

struct factory_options {
  std::string attk_file;
  std::string fingerprint_name = "kmtool fingerprint sensor";
  std::string fingerprint_version = "1.0";
  std::string cpu_id;
  std::string device_id;

  void add_to(CLI::App* verb);
  // data: with what was not given filled in: a fresh RSA-2048 key, and identifiers made of the
  // device's public one. Throws failure (WRONG_USAGE) when the file holds no RSA-2048 key.
  keymaster::client::factory_data data(const tee::device_settings& settings) const;
};

// provision: gives the device in `folder` its data. Throws failure, REFUSED when it has been given
// some before.
void provision(const std::string& folder, const keymaster::client::factory_data& data);

}  // namespace kmtool
