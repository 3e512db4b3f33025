list(APPEND HOXCFG_SOURCES hoxcfg/cmd_plugins.cc)
