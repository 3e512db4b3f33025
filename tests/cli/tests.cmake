# The command-line conventions and docs/cli.md, through the built hoxcfg.
hoxcm_add_test(hoxcfg_cli_test
  cli/hoxcfg_apply_test.cc
  cli/hoxcfg_cli_test.cc
  cli/hoxcfg_docs_test.cc)
if(TARGET hoxcfg)
  add_dependencies(hoxcfg_cli_test hoxcfg cpp_plugin_runner hoxcm_sample_network)
endif()
