# How code of a trusted application is compiled, and how a <uuid>.ta is linked.
#
# ta_library(NAME SOURCES file... [LIBRARIES target...])
#   A static library of TA code: no exceptions, no RTTI, no hidden runtime.
# trusted_application(NAME UUID uuid LIBRARIES target... [SOURCES file...] [LINK_OPTIONS option...]
#                     [FOLDER folder])
#   The shared object ta/<uuid>.ta that exports the five TA_ entry points (host builds only). The
#   uuid is written out or is a name of product/uuids.h. With FOLDER it lies there in place of ta/,
#   below the build tree, and is not installed.

set(TA_COMPILE_OPTIONS
    $<$<COMPILE_LANGUAGE:CXX>:-fno-exceptions> $<$<COMPILE_LANGUAGE:CXX>:-fno-rtti>
    $<$<COMPILE_LANGUAGE:CXX>:-fno-threadsafe-statics> -fvisibility=hidden
    -fno-asynchronous-unwind-tables -fno-math-errno -fno-stack-protector
    $<$<CXX_COMPILER_ID:GNU>:-fno-gnu-unique>  # loaders of TEEs refuse files that are marked as GNU's
    -ffunction-sections -fdata-sections ${KEYMASTER_LTO_COMPILE})

# A TA links the platform, the C library's few memory and text functions, and nothing else: no C++
# runtime and no start files, so what it imports is what a device's TEE must offer. Sanitizers bring
# a runtime of their own and want the usual libraries.
if(NOT KEYMASTER_SANITIZE)
  set(TA_LINK_OPTIONS -nostdlib -Wl,--no-as-needed)  # the TA's own libraries come behind them
  set(TA_LINK_LIBRARIES c gcc)
endif()
list(APPEND TA_LINK_OPTIONS ${KEYMASTER_LTO_LINK})

# Hidden visibility alone lets the standard library's templates through.
set(TA_EXPORTS ${CMAKE_CURRENT_LIST_DIR}/trusted_application.map)

function(ta_library name)
  cmake_parse_arguments(ARG "" "" "SOURCES;LIBRARIES" ${ARGN})
  add_library(${name} STATIC ${ARG_SOURCES})
  target_compile_options(${name} PRIVATE ${TA_COMPILE_OPTIONS})
  set_target_properties(${name} PROPERTIES KEYMASTER_TA ON)
  # The compiler's own functions, division of long numbers for one, come behind who calls them.
  target_link_libraries(${name} PUBLIC ${ARG_LIBRARIES} ${TA_LINK_LIBRARIES})
endfunction()

# The text of a UUID that product/uuids.h defines under `name`, from the numbers that it gives there.
set(PRODUCT_UUIDS ${CMAKE_CURRENT_LIST_DIR}/../product/uuids.h)
set_property(DIRECTORY ${PROJECT_SOURCE_DIR} APPEND PROPERTY CMAKE_CONFIGURE_DEPENDS ${PRODUCT_UUIDS})
function(product_uuid name result)
  file(READ ${PRODUCT_UUIDS} header)
  if(NOT header MATCHES "define ${name} [^{]*{([^{]+){([^}]+)}}")
    message(FATAL_ERROR "product/uuids.h does not define ${name}")
  endif()
  string(REGEX REPLACE "0x|[^0-9a-f]" "" digits "${CMAKE_MATCH_1}${CMAKE_MATCH_2}")
  if(NOT digits MATCHES "^(........)(....)(....)(....)(............)$")
    message(FATAL_ERROR "product/uuids.h: ${name} must give every number in full")
  endif()
  set(${result} ${CMAKE_MATCH_1}-${CMAKE_MATCH_2}-${CMAKE_MATCH_3}-${CMAKE_MATCH_4}-${CMAKE_MATCH_5}
      PARENT_SCOPE)
endfunction()

function(trusted_application name)
  cmake_parse_arguments(ARG "" "UUID;FOLDER" "SOURCES;LIBRARIES;LINK_OPTIONS" ${ARGN})
  if(ARG_UUID MATCHES "^[A-Z_]+$")
    product_uuid(${ARG_UUID} ARG_UUID)
  endif()
  add_library(${name} MODULE ${ARG_SOURCES})
  target_compile_options(${name} PRIVATE ${TA_COMPILE_OPTIONS})
  target_link_libraries(${name} PRIVATE ${ARG_LIBRARIES} tee ${TA_LINK_LIBRARIES})
  target_link_options(${name} PRIVATE ${TA_LINK_OPTIONS} ${KEYMASTER_NO_UNDEFINED} -Wl,--gc-sections
                      -Wl,-z,now -Wl,--version-script=${TA_EXPORTS} ${ARG_LINK_OPTIONS})
  set_target_properties(${name} PROPERTIES
      KEYMASTER_TA ON LINK_DEPENDS ${TA_EXPORTS} PREFIX "" SUFFIX ".ta" OUTPUT_NAME ${ARG_UUID}
      LIBRARY_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR}/ta
      BUILD_RPATH "$ORIGIN/../lib" INSTALL_RPATH "$ORIGIN/..")
  if(ARG_FOLDER)
    set_target_properties(${name} PROPERTIES
        LIBRARY_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR}/${ARG_FOLDER}
        BUILD_RPATH "${PROJECT_BINARY_DIR}/lib")
  else()
    install(TARGETS ${name} LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR}/tee)
  endif()
endfunction()
