# Whether the test suite is built. BUILD_TESTING=ON asks for the tests and
# fails when something they need is missing; OFF leaves them out. Left
# unset, the tests are built when everything they need is installed, so
# that building the libraries never depends on what only the tests use.
# Sets KX_TESTS.

if(DEFINED BUILD_TESTING AND NOT BUILD_TESTING)
  set(KX_TESTS OFF)
  message(STATUS "Tests: off (BUILD_TESTING=OFF)")
  return()
endif()

set(kx_test_missing "")
find_package(GTest QUIET)
if(NOT GTest_FOUND)
  list(APPEND kx_test_missing "GoogleTest (Debian package libgtest-dev)")
endif()
find_package(nlohmann_json 3 QUIET)
if(NOT nlohmann_json_FOUND)
  list(APPEND kx_test_missing "JSON for Modern C++ (Debian package nlohmann-json3-dev)")
endif()
find_program(KX_PKG_CONFIG NAMES pkg-config pkgconf)
if(NOT KX_PKG_CONFIG)
  list(APPEND kx_test_missing "pkg-config (Debian package pkgconf)")
endif()
# localedef builds the tests' Latin-1 locales from the C library's sources.
if(NOT EXISTS /usr/share/i18n/locales/en_US OR NOT EXISTS /usr/share/i18n/charmaps/ISO-8859-1.gz)
  list(APPEND kx_test_missing "the locale sources (Debian package locales)")
endif()
list(JOIN kx_test_missing ", " kx_test_missing_text)

if(DEFINED BUILD_TESTING)
  if(kx_test_missing)
    message(FATAL_ERROR "BUILD_TESTING is ON, but the tests need ${kx_test_missing_text}: "
                        "install them, or configure with -DBUILD_TESTING=OFF")
  endif()
  set(KX_TESTS ON)
  message(STATUS "Tests: on (BUILD_TESTING=ON)")
elseif(kx_test_missing)
  set(KX_TESTS OFF)
  message(STATUS "Tests: off, missing ${kx_test_missing_text} (-DBUILD_TESTING=ON requires them)")
else()
  set(KX_TESTS ON)
  message(STATUS "Tests: on, all they need is installed (-DBUILD_TESTING=OFF leaves them out)")
endif()
