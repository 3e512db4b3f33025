hoxcm_add_test(plugins_test
  plugins/plugin_manifest_test.cc
  plugins/plugin_manager_test.cc
  plugins/plugin_request_test.cc
  plugins/plugin_launcher_test.cc
  plugins/runner_conformance_test.cc
  plugins/runner_paths_test.cc)
# The runners, the sample plugins and the conformance plugin must be built
# before the tests that start them.
add_library(hoxcm_conformance_plugin MODULE plugins/conformance_plugin.cc)
set_target_properties(hoxcm_conformance_plugin PROPERTIES
  OUTPUT_NAME conformance
  LIBRARY_OUTPUT_DIRECTORY ${CMAKE_BINARY_DIR}/tests/plugins)
target_link_libraries(hoxcm_conformance_plugin PRIVATE hoxcm)
if(TARGET cpp_plugin_runner AND TARGET hoxcm_sample_network)
  add_dependencies(plugins_test cpp_plugin_runner hoxcm_sample_network hoxcm_conformance_plugin)
endif()

# Runs the built hoxcfg as a process.
hoxcm_add_test(hoxcfg_plugins_test plugins/hoxcfg_plugins_test.cc)
if(TARGET hoxcfg)
  add_dependencies(hoxcfg_plugins_test hoxcfg cpp_plugin_runner hoxcm_sample_network)
endif()

# Plugins the C++ runner must refuse.
add_library(hoxcm_wrong_abi_plugin MODULE plugins/broken_plugin.cc)
add_library(hoxcm_no_describe_plugin MODULE plugins/broken_plugin.cc)
target_compile_definitions(hoxcm_no_describe_plugin PRIVATE BROKEN_NO_DESCRIBE)
foreach(broken hoxcm_wrong_abi_plugin hoxcm_no_describe_plugin)
  target_include_directories(${broken} PRIVATE ${CMAKE_SOURCE_DIR}/include)
  set_target_properties(${broken} PROPERTIES LIBRARY_OUTPUT_DIRECTORY ${CMAKE_BINARY_DIR}/tests/plugins)
  add_dependencies(plugins_test ${broken})
endforeach()
set_target_properties(hoxcm_wrong_abi_plugin PROPERTIES OUTPUT_NAME wrongabi)
set_target_properties(hoxcm_no_describe_plugin PROPERTIES OUTPUT_NAME nodescribe)
