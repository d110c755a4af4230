# The client library as programs outside this project use it: libtally, its headers, and how builds find it.

include(GNUInstallDirs)
include(CMakePackageConfigHelpers)

# tally.h states it too; a test compares them. The first part is the soname's: it grows when programs that were linked
# with the library before could no longer use it.
set(TALLY_LIBRARY_VERSION 1.0.0)
string(REGEX MATCH "^[0-9]+" TALLY_LIBRARY_SOVERSION ${TALLY_LIBRARY_VERSION})

# The public headers lie in one folder, tally/; within the project they include each other by their places here.
set(staging ${PROJECT_BINARY_DIR}/include)
foreach(header
    framework/c/tally.h framework/c/values.h framework/PithAdaptor.h framework/TallyConnection.h
    framework/TallyConnectionOptions.h framework/TallyKeys.h framework/TallyReply.h platform/Shared.h platform/Value.h)
  set(source ${PROJECT_SOURCE_DIR}/src/${header})
  set_property(DIRECTORY APPEND PROPERTY CMAKE_CONFIGURE_DEPENDS ${source})
  file(READ ${source} text)
  string(REGEX REPLACE "#include \"(framework|platform)/(c/)?([A-Za-z]+\\.h)\"" "#include \"tally/\\3\"" text "${text}")
  get_filename_component(name ${header} NAME)
  file(CONFIGURE OUTPUT ${staging}/tally/${name} CONTENT "${text}" @ONLY)
endforeach()

add_library(tally SHARED c/Connection.cpp c/Options.cpp c/Reply.cpp c/Values.cpp)
add_library(Tally::tally ALIAS tally)
target_link_libraries(tally PRIVATE $<LINK_LIBRARY:WHOLE_ARCHIVE,framework-client>)
target_include_directories(tally
  PRIVATE ${PROJECT_SOURCE_DIR}/src
  INTERFACE $<BUILD_INTERFACE:${staging}> $<INSTALL_INTERFACE:${CMAKE_INSTALL_INCLUDEDIR}>)
target_link_options(tally PRIVATE LINKER:--version-script=${CMAKE_CURRENT_SOURCE_DIR}/libtally.map)
set_target_properties(tally PROPERTIES
  VERSION ${TALLY_LIBRARY_VERSION} SOVERSION ${TALLY_LIBRARY_SOVERSION}
  LINK_DEPENDS ${CMAKE_CURRENT_SOURCE_DIR}/libtally.map
  LIBRARY_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR}/lib)

install(TARGETS tally EXPORT TallyTargets
  LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT library NAMELINK_COMPONENT development)
install(DIRECTORY ${staging}/tally DESTINATION ${CMAKE_INSTALL_INCLUDEDIR} COMPONENT development)

set(packageFolder ${CMAKE_INSTALL_LIBDIR}/cmake/Tally)
configure_package_config_file(${PROJECT_SOURCE_DIR}/packaging/cmake/TallyConfig.cmake.in
  ${PROJECT_BINARY_DIR}/TallyConfig.cmake INSTALL_DESTINATION ${packageFolder})
write_basic_package_version_file(${PROJECT_BINARY_DIR}/TallyConfigVersion.cmake
  VERSION ${TALLY_LIBRARY_VERSION} COMPATIBILITY SameMajorVersion)
install(FILES ${PROJECT_BINARY_DIR}/TallyConfig.cmake ${PROJECT_BINARY_DIR}/TallyConfigVersion.cmake
  DESTINATION ${packageFolder} COMPONENT development)
install(EXPORT TallyTargets NAMESPACE Tally:: DESTINATION ${packageFolder} COMPONENT development)

# Made when it is installed: only then the prefix is known for certain.
install(CODE "
  set(TALLY_INCLUDEDIR \"${CMAKE_INSTALL_INCLUDEDIR}\")
  set(TALLY_LIBDIR \"${CMAKE_INSTALL_LIBDIR}\")
  set(TALLY_LIBRARY_VERSION \"${TALLY_LIBRARY_VERSION}\")
  configure_file(\"${PROJECT_SOURCE_DIR}/packaging/pkgconfig/tally.pc.in\" \"${PROJECT_BINARY_DIR}/tally.pc\" @ONLY)
  " COMPONENT development)
install(FILES ${PROJECT_BINARY_DIR}/tally.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig COMPONENT development)
