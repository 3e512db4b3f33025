hoxcm_add_test(platform_store_test
  platform_store/database_test.cc
  platform_store/contents_test.cc
  platform_store/concurrency_test.cc
  platform_store/document_test.cc)
