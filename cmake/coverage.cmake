# SPACEKEEP_COVERAGE: a directory for the counts of executed lines and branches (clang only). Counted
# is what stands in the daemon's folders, and nothing else. The directory is compiled into
# the programs, so a daemon that a test starts with an empty environment and a root of its own counts
# too: /dev is the one directory that such a root has in common with the machine. The counts live in a
# shared mapping of a file there (%c, which needs the relocation), so those of a killed process stay;
# %m: one file per program, for all its processes. Counted atomically: a line's count may be the
# difference of two, which a lost one would turn into none.
set(SPACEKEEP_COVERAGE "" CACHE PATH "Where programs keep their counts of executed code")
if(SPACEKEEP_COVERAGE)
  set(list ${CMAKE_BINARY_DIR}/counted_sources.list)
  set(text "[clang]\ndefault:skip\n")
  foreach(folder IN ITEMS daemon support registry client operations purge purgeable history)
    string(APPEND text "source:${CMAKE_SOURCE_DIR}/${folder}/*=allow\n")
  endforeach()
  file(CONFIGURE OUTPUT ${list} CONTENT "${text}" @ONLY)
  set(counts "-fprofile-instr-generate=${SPACEKEEP_COVERAGE}/%m%c.profraw")
  add_compile_options(${counts} -fcoverage-mapping -fprofile-list=${list} -fprofile-update=atomic
                      "SHELL:-mllvm -runtime-counter-relocation")
  # The counting library comes with this option, whatever else is said of it.
  set(is_counted $<AND:$<STREQUAL:$<TARGET_PROPERTY:TYPE>,EXECUTABLE>,$<NOT:$<BOOL:$<TARGET_PROPERTY:SK_NOT_COUNTED>>>>)
  add_link_options($<${is_counted}:-fprofile-instr-generate>)
endif()

# For a program without any counted source: the counting library would complain of that at each start.
function(sk_not_counted target)
  if(SPACEKEEP_COVERAGE)
    target_compile_options(${target} PRIVATE -fno-profile-instr-generate -fno-coverage-mapping)
    set_target_properties(${target} PROPERTIES SK_NOT_COUNTED ON)
  endif()
endfunction()
