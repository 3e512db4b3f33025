# The installed package works for a client: find_package and pkg-config.
add_test(NAME install.client_builds_against_installed_package
  COMMAND ${CMAKE_CURRENT_LIST_DIR}/check-install.sh ${CMAKE_BINARY_DIR} ${CMAKE_SOURCE_DIR})
set_tests_properties(install.client_builds_against_installed_package PROPERTIES
  TIMEOUT 600 ENVIRONMENT "CXXFLAGS=${CMAKE_CXX_FLAGS};LDFLAGS=${CMAKE_EXE_LINKER_FLAGS}")
