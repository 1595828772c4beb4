// What kind of platform this is.
#include "tee/core/profile.h"

#include <cstdlib>
#include <string_view>

namespace tee {
namespace {

bool names(std::string_view list, std::string_view word) {
  while (!list.empty()) {
    const size_t end = list.find(',');
    if (list.substr(0, end) == word) return true;
    list.remove_prefix(end == std::string_view::npos ? list.size() : end + 1);
  }
  return false;
}

profile from_environment() {
  const char* words = secure_getenv("TEE_PROFILE");
  if (words == nullptr) return {};
  return {.strict = names(words, "strict"), .extensions = !names(words, "standard")};
}

profile of_process = from_environment();

}  // namespace

const profile& current_profile() {
  return of_process;
}

void set_profile(const profile& wanted) {
  of_process = wanted;
}

}  // namespace tee
