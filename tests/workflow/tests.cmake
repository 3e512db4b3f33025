hoxcm_add_test(workflow_test
  workflow/remediation_plan_test.cc
  workflow/remediation_test.cc)
