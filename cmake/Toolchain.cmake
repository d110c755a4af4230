# Compiler cache, linker and linter, each used when the machine has it.

find_program(CCACHE_PROGRAM ccache)
if(CCACHE_PROGRAM AND NOT TALLYD_TIDY)
  set(CMAKE_C_COMPILER_LAUNCHER ${CCACHE_PROGRAM})
  set(CMAKE_CXX_COMPILER_LAUNCHER ${CCACHE_PROGRAM})
endif()

find_program(MOLD_PROGRAM mold)
if(MOLD_PROGRAM AND NOT TALLYD_FUZZ)
  add_link_options(-fuse-ld=mold)
endif()

if(TALLYD_TIDY)
  find_program(CLANG_TIDY_PROGRAM NAMES clang-tidy-14 clang-tidy REQUIRED)
  set(CMAKE_CXX_CLANG_TIDY ${CLANG_TIDY_PROGRAM})
endif()
