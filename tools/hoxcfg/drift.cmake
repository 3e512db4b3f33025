list(APPEND HOXCFG_SOURCES hoxcfg/cmd_drift.cc)
