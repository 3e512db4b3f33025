list(APPEND HOXCFG_SOURCES hoxcfg/cmd_boot.cc)
