// Who a client of the normal world is.
#include "tee/host/client_identity.h"

#include <algorithm>
#include <array>
#include <climits>
#include <cstring>
#include <string>
#include <unistd.h>
#include <utility>

#include "tee/device/uuid.h"

namespace tee {

namespace {

// The name space of client UUIDs, a random one.
constexpr TEE_UUID NAME_SPACE = {
    0x6d1f0bc3, 0x529e, 0x4e0a, {0x8b, 0x77, 0x3c, 0xd1, 0xe4, 0x90, 0x25, 0xaf}};

// Empty when it cannot be told.
std::string target_of(const std::string& link) {
  std::array<char, PATH_MAX> path{};
  ssize_t length = readlink(link.c_str(), path.data(), path.size());
  return {path.data(), static_cast<size_t>(std::max<ssize_t>(length, 0))};
}

}  // namespace

client_process own_process() {
  const int count = getgroups(0, nullptr);
  std::vector<gid_t> groups(static_cast<size_t>(std::max(count, 0)));
  const int got = getgroups(static_cast<int>(groups.size()), groups.data());
  groups.resize(static_cast<size_t>(std::max(got, 0)));
  groups.push_back(getegid());
  return {geteuid(), std::move(groups), "/proc/self/exe"};
}

TEE_Result identify_client(const client_process& process, uint32_t method, const void* data,
                           TEE_Identity* identity) {
  bool by_group = method == TEE_LOGIN_GROUP || method == TEE_LOGIN_APPLICATION_GROUP;
  bool by_user = method == TEE_LOGIN_USER || method == TEE_LOGIN_APPLICATION_USER;
  bool by_application = method == TEE_LOGIN_APPLICATION || method == TEE_LOGIN_APPLICATION_USER ||
                        method == TEE_LOGIN_APPLICATION_GROUP;
  if (!by_group && !by_user && !by_application && method != TEE_LOGIN_PUBLIC) {
    return TEE_ERROR_BAD_PARAMETERS;
  }
  if (by_group != (data != nullptr)) return TEE_ERROR_BAD_PARAMETERS;

  std::string name;
  if (by_user) name += "user=" + std::to_string(process.user) + ";";
  if (by_group) {
    uint32_t group = 0;
    std::memcpy(&group, data, sizeof(group));
    const auto& groups = process.groups;
    if (std::find(groups.begin(), groups.end(), group) == groups.end()) {
      return TEE_ERROR_ACCESS_DENIED;
    }
    name += "group=" + std::to_string(group) + ";";
  }
  if (by_application) {
    const std::string executable = target_of(process.executable);
    if (executable.empty()) return TEE_ERROR_ACCESS_DENIED;
    name += "application=" + executable;
  }
  *identity = {method, name.empty() ? TEE_UUID{} : name_based_uuid(NAME_SPACE, name)};
  return TEE_SUCCESS;
}

}  // namespace tee
