# Every failpoint armed in turn, with an error and with a kill, in the real
# hoxcfg. Built only where the failpoints are compiled in.
if(HOXCM_FAILPOINTS AND TARGET hoxcfg)
  hoxcm_add_test(failpoint_test failpoints/failpoint_test.cc)
  add_dependencies(failpoint_test hoxcfg cpp_plugin_runner hoxcm_sample_network)
endif()
