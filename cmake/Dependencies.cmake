# Every library that is not ours, as imported targets. All are Debian packages; scripts/lib/packages.sh lists them.

find_package(PkgConfig REQUIRED)
find_package(Threads REQUIRED)
find_package(ZLIB REQUIRED)
find_package(OpenSSL REQUIRED)
find_package(CURL REQUIRED)
find_package(EXPAT REQUIRED)
find_package(fmt REQUIRED)
find_package(CLI11 REQUIRED)
find_package(ICU REQUIRED COMPONENTS uc i18n)
pkg_check_modules(SYSTEMD REQUIRED IMPORTED_TARGET libsystemd)
pkg_check_modules(SECCOMP REQUIRED IMPORTED_TARGET libseccomp)
pkg_check_modules(PLIST REQUIRED IMPORTED_TARGET libplist-2.0)

# Asio and RapidJSON are headers only; they are marked as system headers, so that our warnings stay ours.
find_path(ASIO_INCLUDE_DIR asio.hpp REQUIRED)
add_library(asio INTERFACE)
target_include_directories(asio SYSTEM INTERFACE ${ASIO_INCLUDE_DIR})
target_compile_definitions(asio INTERFACE ASIO_STANDALONE ASIO_NO_DEPRECATED)
target_link_libraries(asio INTERFACE Threads::Threads)

find_path(RAPIDJSON_INCLUDE_DIR rapidjson/rapidjson.h REQUIRED)
add_library(rapidjson INTERFACE)
target_include_directories(rapidjson SYSTEM INTERFACE ${RAPIDJSON_INCLUDE_DIR})
target_compile_definitions(rapidjson INTERFACE RAPIDJSON_HAS_STDSTRING=1)

find_library(HTTPLIB_LIBRARY cpp-httplib)
find_path(HTTPLIB_INCLUDE_DIR httplib.h)
if(HTTPLIB_LIBRARY AND HTTPLIB_INCLUDE_DIR)
  add_library(httplib INTERFACE)
  target_include_directories(httplib SYSTEM INTERFACE ${HTTPLIB_INCLUDE_DIR})
  target_compile_definitions(httplib INTERFACE CPPHTTPLIB_OPENSSL_SUPPORT CPPHTTPLIB_ZLIB_SUPPORT CPPHTTPLIB_BROTLI_SUPPORT)
  target_link_libraries(httplib INTERFACE ${HTTPLIB_LIBRARY} OpenSSL::SSL ZLIB::ZLIB Threads::Threads)
endif()

if(TALLYD_TESTS)
  find_package(GTest REQUIRED)
  include(GoogleTest)
endif()

if(TALLYD_BENCH)
  find_package(benchmark REQUIRED)
endif()
