# The command-line conventions and docs/cli.md, through the built hoxcfg.
hoxcm_add_test(hoxcfg_cli_test
  cli/hoxcfg_apply_test.cc
  cli/hoxcfg_boot_test.cc
  cli/hoxcfg_cli_test.cc
  cli/hoxcfg_item_test.cc
  cli/journal_test.cc)
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

# docs/cli.md, the man pages and bash completion, against hoxcfg --help and
# what hoxcfg --json prints.
if(TARGET hoxcfg_help_pages)
  find_package(Python3 REQUIRED COMPONENTS Interpreter)
  add_test(NAME cli.docs_man_pages_and_completion_follow_the_tool
    COMMAND Python3::Interpreter ${CMAKE_CURRENT_LIST_DIR}/docs_and_help_pages_test.py $<TARGET_FILE:hoxcfg>
            $<TARGET_FILE_DIR:hoxcfg>/man $<TARGET_FILE_DIR:hoxcfg>/completion/hoxcfg ${PROJECT_SOURCE_DIR}/docs/cli.md)
  set_tests_properties(cli.docs_man_pages_and_completion_follow_the_tool PROPERTIES TIMEOUT 300)
endif()
