# Every header compiles alone: one object of nothing but its include, for each.
file(GLOB_RECURSE tallyd_headers RELATIVE ${PROJECT_SOURCE_DIR}
  CONFIGURE_DEPENDS ${PROJECT_SOURCE_DIR}/src/*.h ${PROJECT_SOURCE_DIR}/tools/*.h)
set(header_sources)
foreach(header ${tallyd_headers})
  string(REPLACE "/" "_" source ${header})
  file(CONFIGURE OUTPUT ${CMAKE_CURRENT_BINARY_DIR}/headers/${source}.cpp
    CONTENT "#include \"${PROJECT_SOURCE_DIR}/${header}\"\n")
  list(APPEND header_sources ${CMAKE_CURRENT_BINARY_DIR}/headers/${source}.cpp)
endforeach()
add_library(headers-compile-alone OBJECT ${header_sources})
target_include_directories(headers-compile-alone PRIVATE ${PROJECT_SOURCE_DIR}/src ${PROJECT_SOURCE_DIR}/tools)
target_compile_options(headers-compile-alone PRIVATE -O0 -g0)
target_link_libraries(headers-compile-alone PRIVATE fmt::fmt CLI11::CLI11 httplib PkgConfig::SYSTEMD)
