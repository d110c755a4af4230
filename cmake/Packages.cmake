# The Debian packages, one for each component that something gets installed for. scripts/package builds them.

set(CPACK_GENERATOR DEB)
set(CPACK_PACKAGE_NAME tallyd)
set(CPACK_PACKAGE_VERSION ${PROJECT_VERSION})
set(CPACK_PACKAGE_VENDOR tallyd)
# Each package has its own.
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "")
set(CPACK_PACKAGE_CONTACT "tallyd maintainers <maintainers@quillon.example>")
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_STRIP_FILES ON)

set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_COMPONENTS_GROUPING IGNORE)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_COMPRESSION_TYPE xz)
set(CPACK_DEBIAN_PACKAGE_CONTROL_STRICT_PERMISSION ON)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS_POLICY ">=")
set(CPACK_DEBIAN_ENABLE_COMPONENT_DEPENDS OFF)

set(debian ${PROJECT_SOURCE_DIR}/packaging/debian)
set(sameVersion "(= ${PROJECT_VERSION})")

# systemd brings the programs that make the user and the folders; elsewhere they are packages of their own.
set(CPACK_DEBIAN_DAEMON_PACKAGE_NAME tallyd)
set(CPACK_DEBIAN_DAEMON_PACKAGE_SECTION net)
set(CPACK_DEBIAN_DAEMON_PACKAGE_DEPENDS
  "systemd | systemd-standalone-sysusers | systemd-sysusers, systemd | systemd-standalone-tmpfiles | systemd-tmpfiles")
set(CPACK_DEBIAN_DAEMON_PACKAGE_RECOMMENDS "ca-certificates, tzdata")
set(CPACK_DEBIAN_DAEMON_PACKAGE_SUGGESTS tallyd-tools)
set(CPACK_COMPONENT_DAEMON_DESCRIPTION "reporting daemon
Takes events, errors and log files from client programs over a local socket
and sends them where the signed configuration of the client's type says. The
daemon decorates, samples, filters and hashes them and honours the user's
consent.

It runs in a sandbox, under a user of its own, and is started by its socket.")
set(CPACK_DEBIAN_DAEMON_PACKAGE_CONTROL_EXTRA ${debian}/postinst ${debian}/prerm ${debian}/postrm)

set(CPACK_DEBIAN_TOOLS_PACKAGE_NAME tallyd-tools)
set(CPACK_DEBIAN_TOOLS_PACKAGE_SECTION utils)
set(CPACK_DEBIAN_TOOLS_PACKAGE_SUGGESTS tallyd)
set(CPACK_COMPONENT_TOOLS_DESCRIPTION "tools of the reporting daemon
tallyctl reports messages to the daemon and shows its sessions, tally-station
stands in for the servers that the daemon talks to, and tally-storebag makes
and checks signed configurations.")

set(CPACK_DEBIAN_LIBRARY_PACKAGE_NAME libtally1)
set(CPACK_DEBIAN_LIBRARY_PACKAGE_SECTION libs)
set(CPACK_DEBIAN_LIBRARY_PACKAGE_SUGGESTS tallyd)
set(CPACK_DEBIAN_LIBRARY_PACKAGE_CONTROL_EXTRA
  ${debian}/libtally1/triggers ${debian}/libtally1/postinst ${debian}/libtally1/postrm)
set(CPACK_COMPONENT_LIBRARY_DESCRIPTION "client library of the reporting daemon
Programs that report to the daemon are linked with it.")

set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_NAME libtally-dev)
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_SECTION libdevel)
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_DEPENDS "libtally1 ${sameVersion}")
set(CPACK_COMPONENT_DEVELOPMENT_DESCRIPTION "client library of the reporting daemon (development files)
Headers, CMake package and pkg-config file for programs that report to the
daemon.")

get_cmake_property(components COMPONENTS)
set(CPACK_COMPONENTS_ALL)
foreach(component daemon tools library development)
  if(component IN_LIST components)
    list(APPEND CPACK_COMPONENTS_ALL ${component})
    string(TOUPPER ${component} upper)
    tallyd_install_notices(${component} ${CPACK_DEBIAN_${upper}_PACKAGE_NAME})
  endif()
endforeach()

include(CPack)
