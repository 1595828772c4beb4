// The one call by which a program becomes the service of a device.
#include <exception>

#include "tee/core/log.h"
#include "tee/host/survival.h"
#include "tee/service/serve.h"
#include "tee/service/service.h"

TEE_Result tee_serve(const char* path, uint32_t idle_seconds, void (*ready)(void* context),
                     void* context) try {
  tee::service::service served;
  if (TEE_Result res = served.open(path)) return res;
  tee::survive_faults();
  ready(context);
  served.run(idle_seconds);
  return TEE_SUCCESS;
} catch (const std::exception& error) {
  tee::log_line(TEE_TRACE_ERROR, "%s", error.what());
  return TEE_ERROR_GENERIC;
}
