# Hardening of what runs in the normal world of the host: libteec, the client library and the tool.
# Code of a trusted application is left out (target property KEYMASTER_TA): its runtime has neither
# __stack_chk_fail nor the _chk functions, and a device's own tool chain decides there.
include(CheckPIESupported)
check_pie_supported(LANGUAGES CXX)

if(CMAKE_BUILD_TYPE STREQUAL "Release" AND NOT KEYMASTER_SANITIZE AND NOT CMAKE_CROSSCOMPILING)
  set(is_host $<NOT:$<BOOL:$<TARGET_PROPERTY:KEYMASTER_TA>>>)
  add_compile_options($<${is_host}:-fstack-protector-strong> $<${is_host}:-fstack-clash-protection>)
  add_compile_definitions($<${is_host}:_FORTIFY_SOURCE=2> $<${is_host}:_GLIBCXX_ASSERTIONS>)
  add_link_options(-Wl,-z,relro -Wl,-z,now -Wl,-z,noexecstack)
endif()
