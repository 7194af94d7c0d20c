# SPDX-License-Identifier: Apache-2.0
# The Debian packages, one a component: the libraries, what builds against them, the command, and the plug-ins that are
# built. scripts/package
# configures a tree for them; debian/stage.cmake adds what is known only when the files are in place.
set(LDAPPW_MAINTAINER "ldappw maintainers <maintainers@ldappw.example>" CACHE STRING "Maintainer of the packages")
set(LDAPPW_DEBIAN_ARCHITECTURE "" CACHE STRING "Architecture of the packages; that of the machine when empty")

set(CPACK_GENERATOR DEB)
set(CPACK_PACKAGE_NAME ldappw)
set(CPACK_PACKAGE_VERSION ${PROJECT_VERSION})
set(CPACK_PACKAGE_CONTACT ${LDAPPW_MAINTAINER})
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "")  # each package's text has its own first line
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_COMPONENTS_ALL libs dev tool)
set(CPACK_INSTALL_DEFAULT_DIRECTORY_PERMISSIONS OWNER_READ OWNER_WRITE OWNER_EXECUTE GROUP_READ GROUP_EXECUTE
                                                WORLD_READ WORLD_EXECUTE)
set(CPACK_PRE_BUILD_SCRIPTS ${PROJECT_SOURCE_DIR}/cmake/debian/stage.cmake)
set(CPACK_LDAPPW_DEBIAN ${PROJECT_SOURCE_DIR}/cmake/debian)
set(CPACK_LDAPPW_LIBRARIES ${CMAKE_LIBRARY_OUTPUT_DIRECTORY} ${LDAPPW_EXTRA_RPATH})
set(CPACK_LDAPPW_FOREIGN ${CMAKE_CROSSCOMPILING})

set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_COMPRESSION_TYPE xz)
set(CPACK_DEBIAN_PACKAGE_ARCHITECTURE ${LDAPPW_DEBIAN_ARCHITECTURE})
set(CPACK_DEBIAN_PACKAGE_RELEASE 1)
set(CPACK_DEBIAN_PACKAGE_SOURCE ldappw)
set(CPACK_DEBIAN_PACKAGE_PRIORITY optional)

set(CPACK_DEBIAN_LIBS_PACKAGE_NAME libldappw1)
set(CPACK_DEBIAN_LIBS_PACKAGE_SECTION libs)
set(CPACK_DEBIAN_LIBS_PACKAGE_CONTROL_EXTRA ${CPACK_LDAPPW_DEBIAN}/shlibs ${CPACK_LDAPPW_DEBIAN}/triggers)
set(CPACK_COMPONENT_LIBS_DESCRIPTION "password protection for an LDAP directory server
The library turns clear passwords into the stored forms of a directory
(SHA, salted SHA, MD5, crypt, masked and AES values), tells which form a
stored value has, checks presented passwords, reverses what can be
reversed, and makes and loads the key files of the AES forms.
.
It is called through a plain C interface. Its crypto provider, a thin layer
over the system's libcrypto, and the utility library are included.")

set(CPACK_DEBIAN_DEV_PACKAGE_NAME libldappw-dev)
set(CPACK_DEBIAN_DEV_PACKAGE_SECTION libdevel)
set(CPACK_DEBIAN_DEV_PACKAGE_DEPENDS "libldappw1 (= ${PROJECT_VERSION}-${CPACK_DEBIAN_PACKAGE_RELEASE})")
set(CPACK_COMPONENT_DEV_DESCRIPTION "password protection for an LDAP directory server (development)
The library turns clear passwords into the stored forms of a directory,
checks presented passwords against them, and keeps the keys of the
reversible forms.
.
This package has the headers, the link for the linker, and the package
files of CMake and pkg-config.")

set(CPACK_DEBIAN_TOOL_PACKAGE_NAME ldappw)
set(CPACK_DEBIAN_TOOL_PACKAGE_SECTION admin)
# The packages of the libraries that the command opens at run time, named by the rules for libraries; OpenSSL comes with
# the provider.
string(JOIN ", " opened ${LDAPPW_LDAP_SONAME} ${LDAPPW_ARGON2_SONAME} ${LDAPPW_CRYPT_SONAME})
string(REGEX REPLACE "([0-9])[.]so[.]" "\\1-" opened "${opened}")
string(REPLACE ".so." "" CPACK_DEBIAN_TOOL_PACKAGE_DEPENDS "${opened}")
set(CPACK_COMPONENT_TOOL_DESCRIPTION "stored passwords and key files of an LDAP directory server
The ldappw command makes, identifies, checks and reveals stored passwords,
creates, restores and shows key stash files, and audits and converts the
passwords of directory exports in LDIF, the rotation of AES keys included.
.
Passwords come from a prompt, standard input or a file, never from the
command line.")

# Plug-ins open the library by its name, which no tool sees.
set(ldappw_plugin_depends "libldappw1 (= ${PROJECT_VERSION}-${CPACK_DEBIAN_PACKAGE_RELEASE})")
if(TARGET pw_ldappw)
  list(APPEND CPACK_COMPONENTS_ALL slapd)
  set(CPACK_DEBIAN_SLAPD_PACKAGE_NAME slapd-ldappw)
  set(CPACK_DEBIAN_SLAPD_PACKAGE_SECTION net)
  set(CPACK_DEBIAN_SLAPD_PACKAGE_DEPENDS "${ldappw_plugin_depends}, slapd (>= 2.5)")
  set(CPACK_DEBIAN_SLAPD_PACKAGE_SUGGESTS ldappw)
  set(CPACK_COMPONENT_SLAPD_DESCRIPTION "reversible password schemes for slapd
The module teaches slapd, the server of OpenLDAP, the password schemes
{qVEIL}, {AES128}, {AES192}, {AES256} and {VLDL}, so that the users of a
directory that has such values keep their passwords when it moves.
.
The AES schemes need the key file of that directory.")
endif()
if(TARGET pwdstorage)
  list(APPEND CPACK_COMPONENTS_ALL dirsrv)
  set(CPACK_DEBIAN_DIRSRV_PACKAGE_NAME 389-ds-ldappw)
  set(CPACK_DEBIAN_DIRSRV_PACKAGE_SECTION net)
  set(CPACK_DEBIAN_DIRSRV_PACKAGE_DEPENDS "${ldappw_plugin_depends}, 389-ds-base (>= 2.3)")
  set(CPACK_DEBIAN_DIRSRV_PACKAGE_SUGGESTS ldappw)
  set(CPACK_COMPONENT_DIRSRV_DESCRIPTION "reversible password schemes for 389 Directory Server
The plug-in teaches 389 Directory Server the password schemes {qVEIL},
{AES128}, {AES192}, {AES256} and {VLDL}, so that the users of a directory
that has such values keep their passwords when it moves. At the first login
of each user the server turns the value into one of its own.
.
The AES schemes need the key file of that directory.")
endif()
include(CPack)
