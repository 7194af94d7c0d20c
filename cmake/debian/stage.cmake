# SPDX-License-Identifier: Apache-2.0
# Runs in cpack between the installation into the packages' folders and their packing: adds the documents that every
# package has, strips the programs, compresses what is to be compressed, and computes what the programs depend on.
set(root ${CPACK_TEMPORARY_INSTALL_DIRECTORY})
set(search ${root}/../search)

function(run)
  execute_process(COMMAND ${ARGN} COMMAND_ERROR_IS_FATAL ANY)
endfunction()

foreach(component IN LISTS CPACK_COMPONENTS_ALL)
  string(TOUPPER ${component} upper)
  set(package ${CPACK_DEBIAN_${upper}_PACKAGE_NAME})
  set(documents ${root}/${component}/usr/share/doc/${package})
  file(COPY ${CPACK_LDAPPW_DEBIAN}/copyright DESTINATION ${documents})
  configure_file(${CPACK_LDAPPW_DEBIAN}/changelog ${documents}/changelog.Debian COPYONLY)
  file(GLOB pages ${root}/${component}/usr/share/man/*/*.[1-9])
  run(gzip -9n ${documents}/changelog.Debian ${pages})
endforeach()
run(chmod -R u=rwX,go=rX ${root})
file(GLOB libraries ${root}/libs/usr/lib/*/*.so.* ${root}/libs/usr/lib/*/qel/qellib/*.so)
file(GLOB plugins ${root}/slapd/usr/lib/ldap/*.so ${root}/dirsrv/usr/lib/*/dirsrv/plugins/*.so)
run(chmod a-x ${libraries} ${plugins})
run(strip --strip-unneeded -R .comment -R .note ${libraries} ${plugins} ${root}/tool/usr/bin/ldappw)

# The search reads debian/control of the folder that it runs in.
file(WRITE ${search}/debian/control "Source: ldappw\n\nPackage: ldappw\nArchitecture: any\n")
list(TRANSFORM CPACK_LDAPPW_LIBRARIES PREPEND -l OUTPUT_VARIABLE options)
set(lines ${CPACK_LDAPPW_DEBIAN}/shlibs)
if(CPACK_LDAPPW_FOREIGN)
  # The packages of another architecture are not installed here, but their names and versions are those of this one's.
  # An empty record of packages keeps the 32-bit parts of this one out of the search.
  file(WRITE ${search}/installed/status "")
  list(APPEND options --admindir=${search}/installed)
  file(GLOB installed /var/lib/dpkg/info/lib*:*.shlibs)
  list(APPEND lines ${installed})
endif()
execute_process(COMMAND cat ${lines} OUTPUT_FILE ${search}/shlibs COMMAND_ERROR_IS_FATAL ANY)

function(set_depends component programs)
  string(TOUPPER ${component} upper)
  execute_process(COMMAND dpkg-shlibdeps -O ${options} -L${search}/shlibs
                          -x${CPACK_DEBIAN_${upper}_PACKAGE_NAME} ${programs}
                  WORKING_DIRECTORY ${search} OUTPUT_VARIABLE depends OUTPUT_STRIP_TRAILING_WHITESPACE
                  COMMAND_ERROR_IS_FATAL ANY)
  string(REGEX REPLACE "^shlibs:Depends=" "" depends "${depends}")
  if(CPACK_DEBIAN_${upper}_PACKAGE_DEPENDS)
    string(PREPEND depends "${CPACK_DEBIAN_${upper}_PACKAGE_DEPENDS}, ")
  endif()
  set(CPACK_DEBIAN_${upper}_PACKAGE_DEPENDS "${depends}" PARENT_SCOPE)
endfunction()
set_depends(libs "${libraries}")
set_depends(tool ${root}/tool/usr/bin/ldappw)
foreach(plugin IN LISTS plugins)
  cmake_path(RELATIVE_PATH plugin BASE_DIRECTORY ${root} OUTPUT_VARIABLE component)
  string(REGEX REPLACE "/.*" "" component "${component}")
  set_depends(${component} ${plugin})
endforeach()

# The same sources give the same packages, byte for byte.
run(find ${root} -exec touch --no-dereference --date=@$ENV{SOURCE_DATE_EPOCH} {} +)
