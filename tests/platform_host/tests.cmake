hoxcm_add_test(platform_host_test
  platform_host/host_facts_test.cc
  platform_host/ssh_sync_test.cc)
