# The command-line conventions and docs/cli.md, through the built hoxcfg.
hoxcm_add_test(hoxcfg_cli_test
  cli/hoxcfg_apply_test.cc
  cli/hoxcfg_boot_test.cc
  cli/hoxcfg_cli_test.cc
  cli/hoxcfg_docs_test.cc
  cli/hoxcfg_item_test.cc)
if(TARGET hoxcfg)
  add_dependencies(hoxcfg_cli_test hoxcfg cpp_plugin_runner hoxcm_sample_network)
endif()

# The systemd units, configured with the build tree's hoxcfg.
if(TARGET hoxcfg)
  hoxcm_configure_units("${CMAKE_BINARY_DIR}/tools/hoxcfg" "${PROJECT_SOURCE_DIR}/docs" "${CMAKE_BINARY_DIR}/systemd-test")
  add_test(NAME systemd.units_verify
           COMMAND ${CMAKE_CURRENT_SOURCE_DIR}/cli/verify-units.sh ${CMAKE_BINARY_DIR}/systemd-test)
  set_tests_properties(systemd.units_verify PROPERTIES SKIP_RETURN_CODE 77)
endif()
