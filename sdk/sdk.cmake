# Sample plugins. A plugin is a MODULE library named lib<id parts joined by
# "_">.so that exports hoxcm_plugin_describe (include/hoxcm/plugin_sdk.h).
# It is installed beside its manifest (docs/writing-plugins.md).
add_library(hoxcm_sample_network MODULE ${CMAKE_CURRENT_LIST_DIR}/samples/network/network_plugin.cc)
set_target_properties(hoxcm_sample_network PROPERTIES
  OUTPUT_NAME network
  LIBRARY_OUTPUT_DIRECTORY ${CMAKE_BINARY_DIR}/sample-plugins/network)
target_link_libraries(hoxcm_sample_network PRIVATE hoxcm)
install(TARGETS hoxcm_sample_network
  LIBRARY DESTINATION ${HOXCM_INSTALL_SAMPLE_PLUGINDIR}/network)
