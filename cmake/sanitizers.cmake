# SPACEKEEP_SANITIZE: a list for -fsanitize=, for instance address,undefined or thread.
set(SPACEKEEP_SANITIZE "" CACHE STRING "Sanitizers to build with")
if(SPACEKEEP_SANITIZE)
  add_compile_options(-fsanitize=${SPACEKEEP_SANITIZE} -fno-sanitize-recover=all -g1)
  add_link_options(-fsanitize=${SPACEKEEP_SANITIZE})
endif()
