# sk_library(name GLOB patterns... [EXCLUDE files...]): a static library of one or more rooms.
# A room that holds no source yet gives an interface library.
function(sk_library name)
  cmake_parse_arguments(ARG "" "" "GLOB;EXCLUDE" ${ARGN})
  file(GLOB sources CONFIGURE_DEPENDS RELATIVE ${CMAKE_CURRENT_SOURCE_DIR} ${ARG_GLOB})
  if(ARG_EXCLUDE)
    list(REMOVE_ITEM sources ${ARG_EXCLUDE})
  endif()
  if(NOT sources)
    # Left alone when it is there: all that links it would be linked again.
    file(CONFIGURE OUTPUT ${CMAKE_CURRENT_BINARY_DIR}/empty_${name}.cc CONTENT "")
    set(sources ${CMAKE_CURRENT_BINARY_DIR}/empty_${name}.cc)
  endif()
  add_library(${name} STATIC ${sources})
endfunction()

# sk_room(room): the libraries of one room of support/: sk_<room> from support/<room>/*.cc and
# sk_<room>_linux from support/<room>/linux/*.cc. ROOMS are rooms both stand on, LINUX_ROOMS rooms
# whose Linux half the Linux half stands on.
function(sk_room room)
  cmake_parse_arguments(ARG "" "" "ROOMS;LIBRARIES;LINUX_ROOMS;LINUX_LIBRARIES" ${ARGN})
  list(TRANSFORM ARG_ROOMS PREPEND sk_)
  sk_library(sk_${room} GLOB support/${room}/*.cc)
  target_link_libraries(sk_${room} PUBLIC ${ARG_ROOMS} PRIVATE ${ARG_LIBRARIES})
  sk_library(sk_${room}_linux GLOB support/${room}/linux/*.cc)
  list(TRANSFORM ARG_LINUX_ROOMS PREPEND sk_)
  list(TRANSFORM ARG_LINUX_ROOMS APPEND _linux)
  target_link_libraries(sk_${room}_linux PUBLIC sk_${room} ${ARG_LINUX_ROOMS}
                        PRIVATE ${ARG_LINUX_LIBRARIES})
endfunction()
