// The TEE Client API of a TEE that another process serves.
#pragma once

#include "tee/teec/client_api.h"

namespace tee::remote {

const client_api& api();

}  // namespace tee::remote
