# SPDX-License-Identifier: Apache-2.0
# What an installed tree needs beside the targets: the package files of CMake and pkg-config. The tree may be moved as a
# whole.
include(CMakePackageConfigHelpers)
set(ldappw_package_dir ${CMAKE_INSTALL_LIBDIR}/cmake/ldappw)
configure_package_config_file(cmake/ldappwConfig.cmake.in ${CMAKE_BINARY_DIR}/ldappwConfig.cmake
                              INSTALL_DESTINATION ${ldappw_package_dir})
write_basic_package_version_file(${CMAKE_BINARY_DIR}/ldappwConfigVersion.cmake COMPATIBILITY SameMajorVersion)
install(FILES ${CMAKE_BINARY_DIR}/ldappwConfig.cmake ${CMAKE_BINARY_DIR}/ldappwConfigVersion.cmake
        DESTINATION ${ldappw_package_dir} COMPONENT dev)
install(EXPORT ldappw NAMESPACE ldappw:: FILE ldappwTargets.cmake DESTINATION ${ldappw_package_dir} COMPONENT dev)

file(RELATIVE_PATH LDAPPW_PC_TO_PREFIX /prefix/${CMAKE_INSTALL_LIBDIR}/pkgconfig /prefix)
configure_file(cmake/ldappw.pc.in ${CMAKE_BINARY_DIR}/ldappw.pc @ONLY)
install(FILES ${CMAKE_BINARY_DIR}/ldappw.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig COMPONENT dev)
