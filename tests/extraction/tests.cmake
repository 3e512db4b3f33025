hoxcm_add_test(extraction_test
  extraction/extraction_test.cc
  extraction/host_documents_test.cc)

# Runs the built hoxcfg as a process.
hoxcm_add_test(hoxcfg_store_test
  extraction/hoxcfg_store_test.cc)
if(TARGET hoxcfg)
  add_dependencies(hoxcfg_store_test hoxcfg)
endif()
