// The key and the identity of a device.
#include "tee/device/identity.h"

#include <algorithm>
#include <string_view>

#include "tee/device/uuid.h"

namespace tee {

namespace {

constexpr char IDENTITY_FILE[] = "identity";
constexpr std::string_view KEY_HEADER("KMDK\1\0\0\0", 8);
constexpr std::string_view IDENTITY_HEADER("KMDI\1\0\0\0", 8);
constexpr size_t FLAGS_LENGTH = 4;
constexpr uint8_t FLAG_RPMB = 1;
constexpr size_t CHECK_OFFSET = IDENTITY_HEADER.size() + FLAGS_LENGTH + sizeof(uuid_bytes);
constexpr size_t MAC_OFFSET = CHECK_OFFSET + DEVICE_KEY_LENGTH;
constexpr size_t IDENTITY_FILE_LENGTH = MAC_OFFSET + sizeof(mac_bytes);

device_key check_value(const device_key& key) {
  return derive_key(key, "device key check");
}

secret_bytes secret_bytes_of(const TEE_UUID& identity) {
  uuid_bytes bytes = to_bytes(identity);
  secret_bytes copy(bytes.begin(), bytes.end());
  OPENSSL_cleanse(bytes.data(), bytes.size());
  return copy;
}

mac_bytes identity_mac(const device_key& key, std::span<const uint8_t> bytes) {
  return compute_mac(derive_key(key, "device identity"), bytes);
}

// A file of exactly that length which begins so.
secret_bytes read_whole(const device_folder& folder, const char* name, std::string_view header,
                        size_t length) {
  auto file = folder.read(name, length);
  if (!file) {
    throw device_error(device_error::kind::DAMAGED, folder.path_of(name) + " is missing");
  }
  const std::string_view text(reinterpret_cast<const char*>(file->data()), file->size());
  if (text.size() != length || !text.starts_with(header)) {
    throw device_error(device_error::kind::DAMAGED, folder.path_of(name) + " is malformed");
  }
  return std::move(*file);
}

secret_bytes encode(const device_secrets& secrets) {
  secret_bytes bytes;
  bytes.reserve(IDENTITY_FILE_LENGTH);
  bytes.assign(IDENTITY_HEADER.begin(), IDENTITY_HEADER.end());
  bytes.resize(bytes.size() + FLAGS_LENGTH);
  bytes[IDENTITY_HEADER.size()] = secrets.rpmb ? FLAG_RPMB : 0;
  bytes.insert(bytes.end(), secrets.identity.begin(), secrets.identity.end());
  const device_key check = check_value(secrets.key);
  bytes.insert(bytes.end(), check.begin(), check.end());
  const mac_bytes mac = identity_mac(secrets.key, bytes);
  bytes.insert(bytes.end(), mac.begin(), mac.end());
  return bytes;
}

}  // namespace

device_secrets new_secrets(const TEE_UUID& identity, bool rpmb) {
  device_secrets made{device_key(DEVICE_KEY_LENGTH), secret_bytes_of(identity), rpmb};
  fill_random(made.key);
  return made;
}

void store_identity(const device_folder& folder, const device_secrets& secrets) {
  folder.write(IDENTITY_FILE, encode(secrets));
}

void store_key(const device_folder& folder, const device_secrets& secrets) {
  secret_bytes key(KEY_HEADER.begin(), KEY_HEADER.end());
  key.insert(key.end(), secrets.key.begin(), secrets.key.end());
  folder.write(KEY_FILE, key);
}

device_secrets load_secrets(const device_folder& folder) {
  const secret_bytes file =
      read_whole(folder, KEY_FILE, KEY_HEADER, KEY_HEADER.size() + DEVICE_KEY_LENGTH);
  return load_identity(folder, {file.begin() + KEY_HEADER.size(), file.end()});
}

device_secrets load_identity(const device_folder& folder, device_key key) {
  const secret_bytes file =
      read_whole(folder, IDENTITY_FILE, IDENTITY_HEADER, IDENTITY_FILE_LENGTH);
  const std::span<const uint8_t> bytes(file);
  device_secrets secrets{std::move(key), {}, false};
  if (!same_mac(check_value(secrets.key), bytes.subspan(CHECK_OFFSET, DEVICE_KEY_LENGTH))) {
    throw device_error(device_error::kind::DAMAGED,
                       folder.path_of(KEY_FILE) + " is not the key of the identity beside it");
  }
  if (!same_mac(identity_mac(secrets.key, bytes.first(MAC_OFFSET)), bytes.subspan(MAC_OFFSET))) {
    throw device_error(device_error::kind::DAMAGED,
                       folder.path_of(IDENTITY_FILE) + " is not authentic");
  }
  secrets.rpmb = (bytes[IDENTITY_HEADER.size()] & FLAG_RPMB) != 0;
  const auto identity = bytes.subspan(CHECK_OFFSET - sizeof(uuid_bytes), sizeof(uuid_bytes));
  secrets.identity.assign(identity.begin(), identity.end());
  return secrets;
}

TEE_UUID identity_uuid(const device_secrets& secrets) {
  uuid_bytes bytes{};
  std::ranges::copy(secrets.identity, bytes.begin());
  const TEE_UUID identity = from_bytes(bytes);
  OPENSSL_cleanse(bytes.data(), bytes.size());
  return identity;
}

TEE_UUID public_id_of(const TEE_UUID& identity) {
  const device_key made = derive_key(secret_bytes_of(identity), "public id of a device");
  uuid_bytes id{};
  std::copy_n(made.begin(), id.size(), id.begin());
  return custom_uuid(id);
}

}  // namespace tee
