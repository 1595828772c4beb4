// The factory's side of the vault, which keeps what SOTER needs of a device: its key pair and its
// properties.
#pragma once

#include <string>

#include "keymaster/client/connection.h"
#include "keymaster/client/soter.h"
#include "keymaster/uuids.h"

namespace keymaster::client {

constexpr TEEC_UUID VAULT_UUID = VAULT_TA_UUID;

// The numbers of an RSA key pair (RFC 8017), big-endian. The last five may be empty together.
struct rsa_numbers {
  bytes n, e, d;
  bytes p, q, dp, dq, qinv;
};

// read_rsa_numbers: the eight numbers from the form in which import_key takes an RSA key: each a
// u32 little-endian length and its bytes, in the order n, e, d, p, q, dp, dq, qinv. Throws
// format_error.
rsa_numbers read_rsa_numbers(byte_view key_data);

// What the factory gives a device. Empty fields are not provisioned.
struct factory_data {
  rsa_numbers attk;                 // SOTER takes 2048 bits
  std::string fingerprint_name;     // of the sensor
  std::string fingerprint_version;  // of the sensor
  TEEC_UUID fingerprint_application = FINGERPRINT_UUID;
  std::string cpu_id;     // at most 64 bytes
  std::string device_id;  // at most 128 bytes
  bytes ta_data;          // at most 1024 bytes
};

class vault {
 public:
  // Throws open_error.
  explicit vault(context tee) : connection_(std::move(tee), VAULT_UUID) {}

  // provision: stores the data, once in the life of a device. TEEC_ERROR_ACCESS_CONFLICT when the
  // device was provisioned before; TEEC_ERROR_BAD_PARAMETERS when something is too long (the boxes
  // hold 8192 bytes of key and 512 of properties).
  status provision(const factory_data& data);

 private:
  connection connection_;
};

}  // namespace keymaster::client
