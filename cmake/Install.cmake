# What an installation holds: the three TEE headers, the client library with its headers, libteec
# and the TEE that it loads, the trusted applications, kmtool and teed (each installed where its target is
# made), and the two ways to find them, pkg-config and a CMake package. Every path in it is relative
# to the file that names it, so the tree can be moved.
include(CMakePackageConfigHelpers)

install(DIRECTORY tee/include/ DESTINATION ${CMAKE_INSTALL_INCLUDEDIR} FILES_MATCHING PATTERN "*.h")
install(TARGETS teec tee EXPORT keymaster LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR})
install(TARGETS keymaster_client EXPORT keymaster ARCHIVE DESTINATION ${CMAKE_INSTALL_LIBDIR})

# The numbers are links in the tree, to what the trusted application and the product own.
install(DIRECTORY client/include/ DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}
        FILES_MATCHING PATTERN "*.h" PATTERN tags.h EXCLUDE PATTERN uuids.h EXCLUDE)
install(FILES ta/params/tags.h product/uuids.h DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/keymaster)

set(package_dir ${CMAKE_INSTALL_LIBDIR}/cmake/keymaster)
install(EXPORT keymaster NAMESPACE keymaster:: FILE keymaster-targets.cmake
        DESTINATION ${package_dir})
write_basic_package_version_file(${PROJECT_BINARY_DIR}/keymaster-config-version.cmake
                                 COMPATIBILITY SameMinorVersion)
install(FILES cmake/keymaster-config.cmake ${PROJECT_BINARY_DIR}/keymaster-config-version.cmake
        DESTINATION ${package_dir})

# libdir may be several folders deep, as in lib/x86_64-linux-gnu.
file(RELATIVE_PATH pc_prefix /${CMAKE_INSTALL_LIBDIR}/pkgconfig /)
foreach(name teec keymaster-client)
  configure_file(cmake/${name}.pc.in ${PROJECT_BINARY_DIR}/${name}.pc @ONLY)
  install(FILES ${PROJECT_BINARY_DIR}/${name}.pc
          DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
endforeach()
