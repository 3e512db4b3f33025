list(APPEND HOXCFG_SOURCES hoxcfg/cmd_schema.cc)
