list(APPEND HOXCFG_SOURCES hoxcfg/cmd_item.cc)
