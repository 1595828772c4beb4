# find_package(keymaster): targets keymaster::teec (the TEE Client API) and keymaster::client.
include(${CMAKE_CURRENT_LIST_DIR}/keymaster-targets.cmake)
