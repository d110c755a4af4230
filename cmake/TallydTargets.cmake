# The project's three ways to declare something: a library, a program, a test.

# tallyd_library(NAME SOURCES … LINKS …): the static library of one folder; includes are written from src/.
function(tallyd_library name)
  cmake_parse_arguments(ARG "" "" "SOURCES;LINKS;PRIVATE_LINKS" ${ARGN})
  add_library(${name} STATIC ${ARG_SOURCES})
  target_include_directories(${name} PUBLIC ${PROJECT_SOURCE_DIR}/src)
  target_link_libraries(${name} PUBLIC ${ARG_LINKS} PRIVATE ${ARG_PRIVATE_LINKS})
endfunction()

# tallyd_program(NAME SOURCES … LINKS …): a program in build/PRESET/bin.
function(tallyd_program name)
  cmake_parse_arguments(ARG "" "" "SOURCES;LINKS" ${ARGN})
  add_executable(${name} ${ARG_SOURCES})
  target_include_directories(${name} PRIVATE ${PROJECT_SOURCE_DIR}/src)
  target_compile_definitions(${name} PRIVATE TALLYD_VERSION="${PROJECT_VERSION}")
  target_link_libraries(${name} PRIVATE ${ARG_LINKS})
endfunction()

# tallyd_test(NAME SOURCES … LINKS … [LABELS …] [LOCKS …] [PROGRAMS …]): a test program with Google Test; every case is
# one test of ctest's. Cases that share a LOCK do not run at the same time. PROGRAMS are targets that must be built first
# and are found through TALLYD_BIN_DIR.
function(tallyd_test name)
  cmake_parse_arguments(ARG "" "" "SOURCES;LINKS;LABELS;LOCKS;PROGRAMS" ${ARGN})
  add_executable(${name} ${ARG_SOURCES})
  set_target_properties(${name} PROPERTIES RUNTIME_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR}/tests/bin)
  target_include_directories(${name} PRIVATE ${PROJECT_SOURCE_DIR}/src ${PROJECT_SOURCE_DIR}/tests)
  target_compile_definitions(${name} PRIVATE
    TALLYD_BIN_DIR="${PROJECT_BINARY_DIR}/bin" TALLYD_SOURCE_DIR="${PROJECT_SOURCE_DIR}"
    $<$<STREQUAL:${TALLYD_SANITIZER},thread>:TALLYD_THREAD_SANITIZER>)
  target_link_libraries(${name} PRIVATE ${ARG_LINKS} GTest::gtest GTest::gmock GTest::gtest_main)
  if(ARG_PROGRAMS)
    add_dependencies(${name} ${ARG_PROGRAMS})
  endif()
  # A property without a value would take the next one's name for it.
  set(properties)
  if(ARG_LABELS)
    list(APPEND properties LABELS "${ARG_LABELS}")
  endif()
  if(ARG_LOCKS)
    list(APPEND properties RESOURCE_LOCK "${ARG_LOCKS}")
  endif()
  gtest_discover_tests(${name} DISCOVERY_MODE PRE_TEST PROPERTIES ${properties})
endfunction()
