// The one call by which a program becomes the service of a device.
#pragma once

#include "tee_internal_api.h"

#include <cstdint>

// tee_serve: serves the device in the folder `path` until it is to end; ready(context) is called
// once clients can connect. Results of opening it as open_device; TEE_SUCCESS when it has served.
// The process is taken as it is: faults of trusted applications are survived from now on, and
// SIGTERM, SIGINT and SIGHUP end the service.
extern "C" __attribute__((visibility("default"))) TEE_Result tee_serve(const char* path,
                                                                       uint32_t idle_seconds,
                                                                       void (*ready)(void* context),
                                                                       void* context);
