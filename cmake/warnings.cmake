# Warnings are errors, for both compilers.
add_compile_options(-Wall -Wextra -Wpedantic -Werror -Wshadow -Wnon-virtual-dtor -Woverloaded-virtual
                    -Wconversion -Wsign-conversion -Wcast-align -Wcast-qual -Wformat=2 -Wimplicit-fallthrough
                    -Wundef -Wunused -Wnull-dereference -Wvla -Wextra-semi)
add_compile_options(-fno-omit-frame-pointer -fstack-protector-strong)
if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
  add_compile_options(-Wduplicated-cond -Wlogical-op -Wsuggest-override)
  # False positives of GCC 12 on std::variant and std::string at -O2.
  add_compile_options(-Wno-maybe-uninitialized -Wno-null-dereference -Wno-restrict)
endif()
add_compile_definitions($<$<CONFIG:Release,RelWithDebInfo>:_FORTIFY_SOURCE=2>)
add_compile_definitions($<$<CONFIG:Debug>:_GLIBCXX_ASSERTIONS>)
add_link_options(-Wl,-z,relro -Wl,-z,now -Wl,--as-needed)
