# What a developer building against the installed library finds: a pkg-config file and a
# CMake package, both relative to where the prefix ends up.
include(CMakePackageConfigHelpers)

# From <libdir>/pkgconfig back up to the prefix, whatever --prefix the install is given.
file(RELATIVE_PATH CORVPKG_PC_TO_PREFIX "/p/${CMAKE_INSTALL_LIBDIR}/pkgconfig" "/p")
configure_file(${CMAKE_CURRENT_LIST_DIR}/corvpkg.pc.in corvpkg.pc @ONLY)
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/corvpkg.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)

set(CORVPKG_CMAKE_DIR ${CMAKE_INSTALL_LIBDIR}/cmake/corvpkg)
install(EXPORT corvpkgTargets NAMESPACE corvpkg:: DESTINATION ${CORVPKG_CMAKE_DIR})
configure_package_config_file(${CMAKE_CURRENT_LIST_DIR}/corvpkgConfig.cmake.in
  ${CMAKE_CURRENT_BINARY_DIR}/corvpkgConfig.cmake INSTALL_DESTINATION ${CORVPKG_CMAKE_DIR})
write_basic_package_version_file(${CMAKE_CURRENT_BINARY_DIR}/corvpkgConfigVersion.cmake
  COMPATIBILITY SameMajorVersion)
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/corvpkgConfig.cmake
  ${CMAKE_CURRENT_BINARY_DIR}/corvpkgConfigVersion.cmake DESTINATION ${CORVPKG_CMAKE_DIR})
