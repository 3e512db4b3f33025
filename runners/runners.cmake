# The shared-object runner links the library for the request and result
# formats and the store; the script runner is installed as it is.
add_executable(cpp_plugin_runner
  ${CMAKE_CURRENT_LIST_DIR}/cpp_plugin_runner.cc
  ${CMAKE_CURRENT_LIST_DIR}/runner_support.cc)
target_include_directories(cpp_plugin_runner PRIVATE ${CMAKE_CURRENT_LIST_DIR})
target_link_libraries(cpp_plugin_runner PRIVATE hoxcm ${CMAKE_DL_LIBS})
# Installed where the library starts them (below the prefix /usr: the host's
# fixed runner directory).
install(TARGETS cpp_plugin_runner RUNTIME DESTINATION ${HOXCM_INSTALL_RUNNERDIR})
install(PROGRAMS ${CMAKE_CURRENT_LIST_DIR}/py_plugin_runner DESTINATION ${HOXCM_INSTALL_RUNNERDIR})
set_target_properties(cpp_plugin_runner PROPERTIES INSTALL_RPATH "${CMAKE_INSTALL_FULL_LIBDIR}")
