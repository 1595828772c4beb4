# What an installation holds: the three TEE headers, the client library with its headers, libteec,
# the trusted applications and kmtool (each installed where its target is made), and the two ways to
# find them, pkg-config and a CMake package. Every path in it is relative to the file that names it,
# so the tree can be moved.
include(CMakePackageConfigHelpers)

install(DIRECTORY tee/include/ DESTINATION ${CMAKE_INSTALL_INCLUDEDIR} FILES_MATCHING PATTERN "*.h")
install(TARGETS teec EXPORT keymaster LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR})

# The client's headers lie in include/keymaster/client; they name each other "client/...", and of
# the TA's headers the one of numbers alone.
if(TARGET keymaster_client)
  install(TARGETS keymaster_client EXPORT keymaster ARCHIVE DESTINATION ${CMAKE_INSTALL_LIBDIR})
  install(DIRECTORY client DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/keymaster
          FILES_MATCHING PATTERN "*.h")
  install(FILES product/uuids.h DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/keymaster/product)
  install(FILES ta/params/tags.h DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/keymaster/ta/params)
  target_include_directories(keymaster_client INTERFACE
      $<INSTALL_INTERFACE:${CMAKE_INSTALL_INCLUDEDIR}>
      $<INSTALL_INTERFACE:${CMAKE_INSTALL_INCLUDEDIR}/keymaster>)
  set_target_properties(keymaster_client PROPERTIES EXPORT_NAME client)
endif()

set(package_dir ${CMAKE_INSTALL_LIBDIR}/cmake/keymaster)
install(EXPORT keymaster NAMESPACE keymaster:: FILE keymaster-targets.cmake
        DESTINATION ${package_dir})
write_basic_package_version_file(${PROJECT_BINARY_DIR}/keymaster-config-version.cmake
                                 COMPATIBILITY SameMinorVersion)
install(FILES cmake/keymaster-config.cmake ${PROJECT_BINARY_DIR}/keymaster-config-version.cmake
        DESTINATION ${package_dir})

foreach(name teec keymaster-client)
  configure_file(cmake/${name}.pc.in ${PROJECT_BINARY_DIR}/${name}.pc @ONLY)
  install(FILES ${PROJECT_BINARY_DIR}/${name}.pc
          DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
endforeach()
