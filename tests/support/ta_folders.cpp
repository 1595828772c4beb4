#include "support/ta_folders.h"

#include <stdlib.h>

namespace keymaster::test {
namespace {

const std::filesystem::path BUILT = KEYMASTER_TA_FILE;

}  // namespace

std::filesystem::path keymaster_file() {
  const char* named = getenv("KEYMASTER_TEST_TA");
  return named != nullptr ? std::filesystem::path(named) : BUILT;
}

void use_ta_folders(const std::string& folders) {
  const std::string first = getenv("KEYMASTER_TEST_TA") != nullptr
                                ? keymaster_file().parent_path().string() + ":"
                                : std::string();
  setenv("TEE_TA_PATH", (first + folders).c_str(), 1);
}

void use_own_tas() {
  use_ta_folders(BUILT.parent_path().string());
}

}  // namespace keymaster::test
