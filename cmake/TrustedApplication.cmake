# How code of a trusted application is compiled, and how a <uuid>.ta is linked.
#
# ta_library(NAME SOURCES file... [LIBRARIES target...])
#   A static library of TA code: no exceptions, no RTTI, no hidden runtime.
# trusted_application(NAME UUID uuid LIBRARIES target... [SOURCES file...])
#   The shared object ta/<uuid>.ta that exports the five TA_ entry points (host builds only).

set(TA_COMPILE_OPTIONS
    $<$<COMPILE_LANGUAGE:CXX>:-fno-exceptions> $<$<COMPILE_LANGUAGE:CXX>:-fno-rtti>
    $<$<COMPILE_LANGUAGE:CXX>:-fno-threadsafe-statics> -fvisibility=hidden
    -fno-asynchronous-unwind-tables -fno-math-errno -fno-stack-protector
    -ffunction-sections -fdata-sections)

# A TA links the platform, the C library's few memory and text functions, and nothing else: no C++
# runtime and no start files, so what it imports is what a device's TEE must offer. Sanitizers bring
# a runtime of their own and want the usual libraries.
if(NOT KEYMASTER_SANITIZE)
  set(TA_LINK_OPTIONS -nostdlib -Wl,--no-as-needed)  # the TA's own libraries come behind them
  set(TA_LINK_LIBRARIES c gcc)
endif()

# Hidden visibility alone lets the standard library's templates through.
set(TA_EXPORTS ${CMAKE_CURRENT_LIST_DIR}/trusted_application.map)

function(ta_library name)
  cmake_parse_arguments(ARG "" "" "SOURCES;LIBRARIES" ${ARGN})
  add_library(${name} STATIC ${ARG_SOURCES})
  target_compile_options(${name} PRIVATE ${TA_COMPILE_OPTIONS})
  set_target_properties(${name} PROPERTIES KEYMASTER_TA ON)
  target_link_libraries(${name} PUBLIC ${ARG_LIBRARIES})
endfunction()

function(trusted_application name)
  cmake_parse_arguments(ARG "" "UUID" "SOURCES;LIBRARIES" ${ARGN})
  add_library(${name} MODULE ${ARG_SOURCES})
  target_compile_options(${name} PRIVATE ${TA_COMPILE_OPTIONS})
  target_link_libraries(${name} PRIVATE ${ARG_LIBRARIES} teec ${TA_LINK_LIBRARIES})
  target_link_options(${name} PRIVATE ${TA_LINK_OPTIONS} ${KEYMASTER_NO_UNDEFINED} -Wl,--gc-sections
                      -Wl,-z,now -Wl,--version-script=${TA_EXPORTS})
  set_target_properties(${name} PROPERTIES
      KEYMASTER_TA ON LINK_DEPENDS ${TA_EXPORTS} PREFIX "" SUFFIX ".ta" OUTPUT_NAME ${ARG_UUID}
      LIBRARY_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR}/ta
      BUILD_RPATH "$ORIGIN/../lib" INSTALL_RPATH "$ORIGIN/..")
  install(TARGETS ${name} LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR}/tee)
endfunction()
