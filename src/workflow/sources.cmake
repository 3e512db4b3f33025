# The workflow operations built on the drift engine and the plugin framework.
list(APPEND HOXCM_SOURCES
  src/workflow/apply.cc
  src/workflow/apply_history.cc
  src/workflow/boot.cc
  src/workflow/boot_record.cc
  src/workflow/host_api.cc
  src/workflow/host_api_item.cc
  src/workflow/impact.cc
  src/workflow/impact_handler.cc
  src/workflow/remediation.cc
  src/workflow/remediation_plan.cc
  src/workflow/validation.cc
)
