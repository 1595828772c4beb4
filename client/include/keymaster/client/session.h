// A session with the Keymaster trusted application: one function a command.
//
// Every function returns what became of the command (status) together with its outputs, which are
// empty unless the command is done. An answer that is not in its form is TEEC_ERROR_BAD_FORMAT with
// origin TEEC_ORIGIN_API. Sessions of one device share all state: configuration and operations.
#pragma once

#include "keymaster/client/connection.h"
#include "keymaster/client/param_set.h"
#include "keymaster/uuids.h"

namespace keymaster::client {

constexpr TEEC_UUID KEYMASTER_UUID = KEYMASTER_TA_UUID;

enum class command : uint32_t {
  GENERATE_KEY = 13,
  GET_KEY_CHARACTER_SIZE = 14,
  GET_KEY_CHARACTER = 15,
  BEGIN = 16,
  UPDATE = 17,
  FINISH = 18,
  IMPORT_KEY = 19,
  EXPORT_KEY = 20,
  DELETE_KEY = 21,
  DELETE_ALL_KEYS = 22,
  ABORT = 23,
  ATTEST_KEY = 24,
  CONFIGURE = 25,
  UPGRADE_KEY = 26,
};

// Who asks for a key: what it was bound to when it was made. Empty where it was bound to nothing.
struct application {
  bytes id;
  bytes data;

  // bind: adds KM_TAG_APPLICATION_ID and KM_TAG_APPLICATION_DATA, each unless empty.
  void bind(param_set* params) const;
};

struct key_result : status {
  bytes blob;
  param_set characteristics;  // from import_key alone
};

struct characteristics_result : status {
  param_set characteristics;  // without application id and data
};

struct data_result : status {
  bytes data;
};

struct begin_result : status {
  uint32_t handle = 0;
  param_set params;  // such as the nonce that the device chose
};

struct update_result : status {
  size_t consumed = 0;  // bytes of the input that were taken
  bytes output;
};

struct finish_result : status {
  bytes output;
  param_set params;
};

struct attest_result : status {
  bytes chain;         // as the command writes it
  uint32_t value = 0;  // what it left in slot 0 b
};

class session {
 public:
  // Opens a session. Throws open_error.
  explicit session(context tee, const TEEC_UUID& application = KEYMASTER_UUID);

  // configure: tells the system's version (decimal MMmmss) and patch level (decimal YYYYMM); every
  // other command wants that first. The second form sends any set.
  status configure(uint32_t os_version, uint32_t os_patchlevel);
  status configure(const param_set& params);

  // generate_key: makes a key that `description` describes (KM_TAG_ALGORITHM and what that wants).
  key_result generate_key(const param_set& description);

  // import_key: wraps key data in the algorithm's raw form: the key's bytes for HMAC and AES.
  key_result import_key(const param_set& description, byte_view key_data);

  // get_key_characteristics: asks for the size, then for the characteristics.
  characteristics_result get_key_characteristics(byte_view blob, const application& app = {});

  // export_key: the public key of an RSA or EC key, as its algorithm writes it.
  data_result export_key(byte_view blob, const application& app = {});

  // upgrade_key: a new blob under the configured version; `params` hold what the key is bound to.
  key_result upgrade_key(byte_view blob, const param_set& params = {});

  status delete_key(byte_view blob);
  status delete_all_keys();

  attest_result attest_key(byte_view blob, const param_set& params);

  // begin: starts an operation for `purpose` (KM_PURPOSE_...). Its handle lives until finish,
  // abort, or a failed update; class operation sees to that.
  begin_result begin(uint32_t purpose, byte_view blob, const param_set& params);

  // update: feeds input, of which `consumed` bytes were taken. A failure ends the operation.
  update_result update(uint32_t handle, byte_view input, const param_set& params = {});

  // finish: ends the operation whatever the outcome. `input` is a signature to verify; data belongs
  // into update, since HMAC and AES do not look at what finish brings.
  // `room`: how much output to expect when it may be more than 16 KiB: a SOTER key's document holds
  // the message, at most doubled.
  finish_result finish(uint32_t handle, byte_view input = {}, const param_set& params = {},
                       size_t room = 0);

  status abort(uint32_t handle);

  // invoke: one command as it is, for what has no function here; see connection::invoke.
  status invoke(uint32_t command_id, uint32_t types, parameter_slots* slots) {
    return connection_.invoke(command_id, types, slots);
  }

 private:
  struct exchange;
  exchange call(command id, uint32_t a, byte_view input, size_t capacity);
  exchange call_growing(command id, byte_view input);
  key_result call_for_blob(command id, byte_view input);

  connection connection_;
  bytes output_;  // serves every command; an exchange's output points into it
};

// The two answers that hold more than one field, read apart; both throw format_error.
// parse_imported: blob field, characteristics field.
void parse_imported(byte_view answer, key_result* result);
// parse_finished: output field, output parameters field.
void parse_finished(byte_view answer, finish_result* result);

}  // namespace keymaster::client
