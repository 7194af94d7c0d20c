# SPDX-License-Identifier: Apache-2.0
# The version stands in a public header too, for programs to look at: stops when it is not the project's.
set(header ${PROJECT_SOURCE_DIR}/src/libraries/libcrypto/include/encoding_utils.h)
set_property(DIRECTORY APPEND PROPERTY CMAKE_CONFIGURE_DEPENDS ${header})
math(EXPR number "10000 * ${PROJECT_VERSION_MAJOR} + 100 * ${PROJECT_VERSION_MINOR} + ${PROJECT_VERSION_PATCH}")
file(STRINGS ${header} stated REGEX "^#define LDAPPW_VERSION")
if(NOT stated STREQUAL "#define LDAPPW_VERSION ${number};#define LDAPPW_VERSION_TEXT \"${PROJECT_VERSION}\"")
  message(FATAL_ERROR "The version is ${PROJECT_VERSION} in CMakeLists.txt, but ${header} has: ${stated}")
endif()
