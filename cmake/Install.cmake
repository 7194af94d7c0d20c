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

# The manual of the library: a page a header, which scripts/make/make_manual.py makes, and a link for each operation on
# it. Their suffix sets them apart from pages of the same names, of which systems have some. And an example to start
# from.
set(manual ${PROJECT_SOURCE_DIR}/docs/man)
set(links ${CMAKE_BINARY_DIR}/man3)
foreach(header IN LISTS LDAPPW_PUBLIC_HEADERS)
  cmake_path(GET header STEM page)
  install(FILES ${manual}/${page}.3 DESTINATION ${CMAKE_INSTALL_MANDIR}/man3 RENAME ${page}.3ldappw COMPONENT dev)
  set_property(DIRECTORY APPEND PROPERTY CMAKE_CONFIGURE_DEPENDS ${manual}/${page}.3)
  file(STRINGS ${manual}/${page}.3 names REGEX "^\\.Nm ")
  list(TRANSFORM names REPLACE "^\\.Nm ([A-Za-z0-9_]+).*" "\\1")
  list(REMOVE_ITEM names ${page})
  foreach(name IN LISTS names)
    file(CONFIGURE OUTPUT ${links}/${name}.3ldappw CONTENT ".so man3/${page}.3ldappw\n")
    install(FILES ${links}/${name}.3ldappw DESTINATION ${CMAKE_INSTALL_MANDIR}/man3 COMPONENT dev)
  endforeach()
endforeach()
install(FILES ${manual}/ldappw.7 DESTINATION ${CMAKE_INSTALL_MANDIR}/man7 COMPONENT dev)
install(FILES ${PROJECT_SOURCE_DIR}/docs/server.md DESTINATION ${CMAKE_INSTALL_DOCDIR} COMPONENT dev)
install(FILES ${PROJECT_SOURCE_DIR}/examples/CMakeLists.txt ${PROJECT_SOURCE_DIR}/examples/server.c
        DESTINATION ${CMAKE_INSTALL_DATADIR}/ldappw/examples COMPONENT dev)
