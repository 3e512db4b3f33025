hoxcm_add_test(workflow_test
  workflow/apply_test.cc
  workflow/boot_test.cc
  workflow/host_api_test.cc
  workflow/impact_test.cc
  workflow/remediation_plan_test.cc
  workflow/remediation_test.cc
  workflow/validation_test.cc
  workflow/verdicts_e2e_test.cc)
# The end-to-end cases start the runners with the sample plugins.
if(TARGET cpp_plugin_runner AND TARGET hoxcm_sample_network)
  add_dependencies(workflow_test cpp_plugin_runner hoxcm_sample_network)
endif()
