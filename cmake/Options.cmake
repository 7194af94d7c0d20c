# SPDX-License-Identifier: Apache-2.0
# Compiler and linker settings that every target of the build shares.
set(LDAPPW_SANITIZE "" CACHE STRING "Sanitizers to build with, as -fsanitize= takes them")
option(LDAPPW_COVERAGE "Instrument for gcov" OFF)
option(LDAPPW_WERROR "Take warnings for errors; on in the presets" OFF)

set(CMAKE_CXX_STANDARD 17)
set(CMAKE_CXX_STANDARD_REQUIRED ON)
set(CMAKE_CXX_EXTENSIONS OFF)
set(CMAKE_C_STANDARD 11)
set(CMAKE_C_STANDARD_REQUIRED ON)
set(CMAKE_C_EXTENSIONS OFF)
set(CMAKE_POSITION_INDEPENDENT_CODE ON)
set(CMAKE_C_VISIBILITY_PRESET hidden)
set(CMAKE_CXX_VISIBILITY_PRESET hidden)
set(CMAKE_VISIBILITY_INLINES_HIDDEN ON)
set(CMAKE_CXX_FLAGS_RELEASE "-O2 -DNDEBUG")
set(CMAKE_C_FLAGS_RELEASE "-O2 -DNDEBUG")
# The sanitizers' builds: their reports need lines, no variables.
set(CMAKE_CXX_FLAGS_SANITIZE "-O1 -g1")
set(CMAKE_C_FLAGS_SANITIZE "-O1 -g1")

add_library(ldappw_options INTERFACE)
# Files and times of any size on 32-bit targets too.
target_compile_definitions(ldappw_options INTERFACE _FILE_OFFSET_BITS=64 _TIME_BITS=64)
target_compile_options(ldappw_options INTERFACE -fno-plt -Wall -Wextra -Wpedantic -Wconversion -Wshadow
                                                $<$<BOOL:${LDAPPW_WERROR}>:-Werror>)
if(LDAPPW_SANITIZE)
  target_compile_options(ldappw_options INTERFACE -fsanitize=${LDAPPW_SANITIZE} -fno-sanitize-recover=all
                                                  -fno-omit-frame-pointer)
  target_link_options(ldappw_options INTERFACE -fsanitize=${LDAPPW_SANITIZE})
  # The provider's entries have handle types that the product, which knows them by name alone, calls with void*.
  target_compile_options(ldappw_options INTERFACE $<$<CXX_COMPILER_ID:Clang>:-fno-sanitize=function>)
endif()
include(CheckCXXCompilerFlag)
check_cxx_compiler_flag(-fcf-protection LDAPPW_CF_PROTECTION)
# Release files: guarded stacks, checked copies, marked jump targets, and no path of the machine that builds them. A
# target with the property LDAPPW_GUARD_ARRAYS_ALONE has the guard in functions with arrays, not wherever an address is
# taken. Builds of the type None are those of distributions, with flags of their own; Debian's leave the paths as they
# are when one has a blank, and do not reach assembly.
target_compile_options(ldappw_options INTERFACE
  $<$<CONFIG:Release>:-fstack-protector$<$<NOT:$<BOOL:$<TARGET_PROPERTY:LDAPPW_GUARD_ARRAYS_ALONE>>>:-strong>>
  $<$<AND:$<CONFIG:Release,None>,$<BOOL:${LDAPPW_CF_PROTECTION}>>:-fcf-protection>
  "$<$<CONFIG:Release,None>:-ffile-prefix-map=${PROJECT_SOURCE_DIR}=.>")
target_compile_definitions(ldappw_options INTERFACE $<$<CONFIG:Release>:_FORTIFY_SOURCE=3>)
if(LDAPPW_COVERAGE)
  target_compile_options(ldappw_options INTERFACE --coverage -fprofile-update=atomic)
  target_link_options(ldappw_options INTERFACE --coverage)
endif()

# For sources that take long to compile and are not what a build is for: the suites, and the command under a sanitizer.
# The checks left out there are the costly ones of the undefined-behaviour sanitizer; bad pointers still end the
# program.
function(ldappw_compile_quickly target)
  if(LDAPPW_SANITIZE MATCHES undefined)
    target_compile_options(${target} PRIVATE -fno-sanitize=null,alignment,object-size,vptr)
  endif()
  target_compile_options(${target} PRIVATE $<IF:$<CONFIG:Release,None>,-O1,-O0>)
endfunction()

# The linker's part of a shared library: nothing undefined, tables read-only after start-up, and one list of exports.
# The sanitizers' runtimes resolve at load time only, so their builds leave the first of these out.
function(ldappw_harden target versionScript)
  target_link_options(${target} PRIVATE -Wl,-z,relro -Wl,-z,now -Wl,--version-script=${versionScript})
  if(NOT LDAPPW_SANITIZE)
    target_link_options(${target} PRIVATE -Wl,-z,defs)
  endif()
  set_target_properties(${target} PROPERTIES LINK_DEPENDS ${versionScript})
endfunction()
