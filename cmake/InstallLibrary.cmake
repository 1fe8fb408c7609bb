# SPDX-License-Identifier: Apache-2.0
# Installs libveldfirewall with its headers, and what other builds find it with: a CMake package and a pkg-config file.
# Both work wherever the installed tree is moved to. The stand-in libraries are part of the CMake package, so that a
# program's linker is told where libveldfirewall's own libraries lie.
include(CMakePackageConfigHelpers)

install(TARGETS veldfirewall EXPORT veldfirewallTargets
  LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT Library NAMELINK_COMPONENT Development)
if(VELD_PLATFORM STREQUAL "linux")
  install(TARGETS veld_core veld_sdk veld_net veld_serviceconf veld_km veld_platform_headers EXPORT veldfirewallTargets
    LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT Runtime NAMELINK_COMPONENT Development)
endif()
install(DIRECTORY ${PROJECT_SOURCE_DIR}/include/veldfirewall DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}
  COMPONENT Development FILES_MATCHING PATTERN "*.h")

set(package_dir ${CMAKE_INSTALL_LIBDIR}/cmake/veldfirewall)
install(EXPORT veldfirewallTargets NAMESPACE veldfirewall:: DESTINATION ${package_dir} COMPONENT Development)
configure_package_config_file(${PROJECT_SOURCE_DIR}/cmake/veldfirewallConfig.cmake.in
  ${CMAKE_CURRENT_BINARY_DIR}/veldfirewallConfig.cmake INSTALL_DESTINATION ${package_dir})
write_basic_package_version_file(${CMAKE_CURRENT_BINARY_DIR}/veldfirewallConfigVersion.cmake
  COMPATIBILITY SameMajorVersion)
install(FILES
  ${CMAKE_CURRENT_BINARY_DIR}/veldfirewallConfig.cmake ${CMAKE_CURRENT_BINARY_DIR}/veldfirewallConfigVersion.cmake
  DESTINATION ${package_dir} COMPONENT Development)

# The prefix in veldfirewall.pc is told from where the file lies.
file(RELATIVE_PATH VELD_PC_PREFIX /prefix/${CMAKE_INSTALL_LIBDIR}/pkgconfig /prefix)
string(REGEX REPLACE "/$" "" VELD_PC_PREFIX ${VELD_PC_PREFIX})
configure_file(${PROJECT_SOURCE_DIR}/cmake/veldfirewall.pc.in ${CMAKE_CURRENT_BINARY_DIR}/veldfirewall.pc @ONLY)
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/veldfirewall.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig
  COMPONENT Development)
