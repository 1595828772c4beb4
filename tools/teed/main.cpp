// teed: serves one device to the programs of its owner, until it is told to end. libteec starts it
// with the first program that wants the device.
#include <CLI/CLI.hpp>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <string>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sysexits.h>
#include <unistd.h>

#include "background.h"
#include "tee/service/serve.h"

namespace {

struct options {
  std::string device;
  std::string ta_path;
  uint32_t idle_seconds = 0;
  bool foreground = false;
  bool if_unserved = false;
};

// Nothing that the service does needs more rights than it has, nobody reads its files or memory,
// and it holds no folder.
void confine() {
  umask(S_IRWXG | S_IRWXO);
  prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0);
  prctl(PR_SET_DUMPABLE, 0, 0, 0, 0);
  const rlimit no_core{0, 0};
  setrlimit(RLIMIT_CORE, &no_core);
  if (chdir("/") != 0) fprintf(stderr, "teed: cannot leave the working folder\n");
}

int exit_status(TEE_Result result) {
  switch (result) {
    case TEE_SUCCESS:
      return EX_OK;
    case TEE_ERROR_ITEM_NOT_FOUND:
      return EX_NOINPUT;
    case TEE_ERROR_BUSY:
      return EX_TEMPFAIL;
    case TEE_ERROR_BAD_FORMAT:
      return EX_DATAERR;
    case TEE_ERROR_ACCESS_DENIED:
      return EX_NOPERM;
    default:
      return EX_OSERR;
  }
}

void be_ready(void* starter) {
  static_cast<teed::starter*>(starter)->be_ready();
}

int serve(const options& given) {
  if (!given.ta_path.empty()) setenv("TEE_TA_PATH", given.ta_path.c_str(), 1);
  if (given.foreground) {
    teed::starter nobody;
    confine();
    return exit_status(tee_serve(given.device.c_str(), given.idle_seconds, be_ready, &nobody));
  }
  teed::starter waiting;
  if (waiting.leave()) return waiting.wait_for_child();
  // From here on in the background.
  waiting.log_to(given.device + "/teed.log");
  confine();
  // Who looks whether the folder is taken has it for that moment: a refusal can be for nothing.
  const auto end = std::chrono::steady_clock::now() + teed::STARTING;
  TEE_Result res = TEE_ERROR_BUSY;
  do {
    if (given.if_unserved && teed::wait_while_starting(given.device)) return EX_OK;
    res = tee_serve(given.device.c_str(), given.idle_seconds, be_ready, &waiting);
  } while (res == TEE_ERROR_BUSY && given.if_unserved && std::chrono::steady_clock::now() < end);
  return exit_status(res);
}

int run(int argc, char** argv) {
  options given;
  CLI::App app("Serves a device to the programs of its owner.", "teed");
  app.set_version_flag("--version", "teed " TEED_VERSION);
  app.add_option("--device", given.device, "Folder of the device")->required()->type_name("DIR");
  app.add_flag("--foreground", given.foreground, "Stay in the foreground, trace to standard error");
  app.add_option("--ta-path", given.ta_path, "Folders of trusted applications, colons between them")
      ->type_name("LIST");
  app.add_option("--idle", given.idle_seconds, "End when nobody was connected for so long")
      ->type_name("SECONDS");
  app.add_flag("--if-unserved", given.if_unserved, "Succeed at once when the device is served");
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    return app.exit(error) == 0 ? EX_OK : EX_USAGE;
  }
  teed::close_strangers();
  char* whole = realpath(given.device.c_str(), nullptr);  // the working folder is left
  if (whole == nullptr) {
    fprintf(stderr, "teed: there is no device at %s\n", given.device.c_str());
    return EX_NOINPUT;
  }
  given.device = whole;
  free(whole);
  return serve(given);
}

}  // namespace

int main(int argc, char** argv) {
  try {
    return run(argc, argv);
  } catch (const std::exception& error) {
    fprintf(stderr, "teed: %s\n", error.what());
    return EX_OSERR;
  }
}
