// Starting the process that serves a device. The program has its own environment from nobody: what
// trusted applications are loaded is not for the first client to say.
#include "tee/remote/start.h"

#include <array>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <dlfcn.h>
#include <spawn.h>
#include <sys/wait.h>
#include <sysexits.h>
#include <unistd.h>

namespace tee::remote {

namespace {

constexpr int FOUND_HERE = 0;

// Beside this library as built, and as installed.
std::string program() {
  Dl_info own{};
  if (dladdr(&FOUND_HERE, &own) == 0 || own.dli_fname == nullptr) return "";
  const std::string here = own.dli_fname;
  const std::string folder = here.substr(0, here.rfind('/') + 1);
  for (const char* place : {"../bin/teed", TEED_FROM_LIBRARY}) {
    if (access((folder + place).c_str(), X_OK) == 0) return folder + place;
  }
  return "";
}

TEEC_Result result_of(int status) {
  switch (status) {
    case EX_OK:
      return TEEC_SUCCESS;
    case EX_NOINPUT:
      return TEEC_ERROR_ITEM_NOT_FOUND;
    case EX_TEMPFAIL:
      return TEEC_ERROR_BUSY;
    case EX_DATAERR:
      return TEEC_ERROR_BAD_FORMAT;
    case EX_NOPERM:
      return TEEC_ERROR_ACCESS_DENIED;
    default:
      return TEEC_ERROR_COMMUNICATION;
  }
}

}  // namespace

TEEC_Result start_service(const std::string& path) {
  std::string found = program();
  if (found.empty()) {
    fprintf(stderr, "[TEE] cannot find teed, which serves devices\n");
    return TEEC_ERROR_COMMUNICATION;
  }
  std::string device = path;
  std::string device_option = "--device";
  std::string quiet_option = "--if-unserved";
  const std::array<char*, 5> arguments = {found.data(), device_option.data(), device.data(),
                                          quiet_option.data(), nullptr};
  const std::array<char*, 1> environment = {nullptr};
  pid_t child = 0;
  const int failed =
      posix_spawn(&child, found.c_str(), nullptr, nullptr, arguments.data(), environment.data());
  if (failed != 0) {
    fprintf(stderr, "[TEE] cannot start %s: %s\n", found.c_str(), strerror(failed));
    return TEEC_ERROR_COMMUNICATION;
  }
  int status = 0;
  pid_t waited = 0;
  do {
    waited = waitpid(child, &status, 0);
  } while (waited < 0 && errno == EINTR);
  // A program that does not care for its children is not told how they ended.
  if (waited < 0) return TEEC_SUCCESS;
  return WIFEXITED(status) ? result_of(WEXITSTATUS(status)) : TEEC_ERROR_COMMUNICATION;
}

}  // namespace tee::remote
