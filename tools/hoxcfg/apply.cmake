list(APPEND HOXCFG_SOURCES hoxcfg/cmd_apply.cc)
