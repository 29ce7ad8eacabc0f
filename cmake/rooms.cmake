# sk_library(name GLOB patterns... [EXCLUDE files...]): a static library of one or more rooms.
# A room that holds no source yet gives an interface library.
function(sk_library name)
  cmake_parse_arguments(ARG "" "" "GLOB;EXCLUDE" ${ARGN})
  file(GLOB sources CONFIGURE_DEPENDS RELATIVE ${CMAKE_CURRENT_SOURCE_DIR} ${ARG_GLOB})
  if(ARG_EXCLUDE)
    list(REMOVE_ITEM sources ${ARG_EXCLUDE})
  endif()
  if(NOT sources)
    file(WRITE ${CMAKE_CURRENT_BINARY_DIR}/empty_${name}.cc "")
    set(sources ${CMAKE_CURRENT_BINARY_DIR}/empty_${name}.cc)
  endif()
  add_library(${name} STATIC ${sources})
endfunction()
