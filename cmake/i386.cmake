# SPDX-License-Identifier: Apache-2.0
# The 32-bit x86 target on a 64-bit system: -m32, with the libraries of the private folder that
# scripts/make/sysroot-i386 unpacks.
set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR i686)
set(CMAKE_C_COMPILER gcc)
set(CMAKE_CXX_COMPILER g++)
set(CMAKE_ASM_FLAGS_INIT -m32)

if(NOT LDAPPW_SYSROOT)
  set(LDAPPW_SYSROOT ${CMAKE_CURRENT_LIST_DIR}/../build/sysroot-i386)
endif()
set(ldappw_root ${LDAPPW_SYSROOT})
cmake_path(NORMAL_PATH ldappw_root)
set(ldappw_libraries ${ldappw_root}/usr/lib/i386-linux-gnu)
set(CMAKE_C_FLAGS_INIT "-m32 -isystem ${ldappw_root}/usr/include/i386-linux-gnu")
set(CMAKE_CXX_FLAGS_INIT "-m32 -isystem ${ldappw_root}/usr/include/i386-linux-gnu")
# The programs of the build tree find the folder for themselves and for what they load.
foreach(kind EXE SHARED MODULE)
  set(CMAKE_${kind}_LINKER_FLAGS_INIT
      "-Wl,-rpath-link,${ldappw_libraries} -Wl,-rpath-link,${ldappw_root}/lib/i386-linux-gnu")
endforeach()
string(APPEND CMAKE_EXE_LINKER_FLAGS_INIT " -Wl,--disable-new-dtags")

set(CMAKE_LIBRARY_ARCHITECTURE i386-linux-gnu)
set(CMAKE_PREFIX_PATH ${ldappw_root}/usr)
set(CMAKE_LIBRARY_PATH ${ldappw_libraries} ${ldappw_root}/lib/i386-linux-gnu)
set(OPENSSL_ROOT_DIR ${ldappw_root}/usr)
set(CMAKE_BUILD_RPATH ${ldappw_libraries} ${ldappw_root}/lib/i386-linux-gnu)
set(LDAPPW_EXTRA_RPATH ${CMAKE_BUILD_RPATH})  # for what is linked as it will be installed
