list(APPEND HOXCFG_SOURCES hoxcfg/cmd_verdicts.cc)
