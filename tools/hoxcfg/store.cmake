list(APPEND HOXCFG_SOURCES hoxcfg/cmd_store.cc hoxcfg/host_setup.cc)
