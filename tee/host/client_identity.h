// Who a client of the normal world is, found out by the TEE and not taken from the client's words.
#pragma once

#include "tee_internal_api.h"

#include <cstdint>
#include <string>
#include <sys/types.h>
#include <vector>

namespace tee {

// A process as the kernel knows it.
struct client_process {
  uid_t user;                 // effective
  std::vector<gid_t> groups;  // effective and supplementary
  std::string executable;     // a link to it below /proc
};

// own_process: the calling one. May throw std::bad_alloc.
client_process own_process();

// identify_client: the identity of a process for a TEEC_LOGIN_ method. Public has the nil UUID; the
// others have a name-based one (RFC 4122, version 5) of the user id, the group id or the
// executable's path, or of two of them. The group methods take the group, a uint32_t that the
// process must be a member of, from `data`; the others want null. TEE_ERROR_BAD_PARAMETERS, or
// TEE_ERROR_ACCESS_DENIED for a group that the process is not in and for an executable that cannot
// be told. May throw std::bad_alloc.
[[nodiscard]] TEE_Result identify_client(const client_process& process, uint32_t method,
                                         const void* data, TEE_Identity* identity);

}  // namespace tee
