# SPDX-License-Identifier: Apache-2.0
# Large system headers are read once a build, not once a source. Every source still includes what it uses: the builds
# without this (the packages', clang-tidy's) show what is missing.
option(LDAPPW_PRECOMPILE "Read the large system headers once for the command and once for the suites" ON)

# Sets the headers up for a target's sources.
function(ldappw_precompile target)
  if(LDAPPW_PRECOMPILE)
    target_precompile_headers(${target} ${ARGN})
  endif()
endfunction()
