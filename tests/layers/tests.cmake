# The layers include one way (docs/architecture.md): the check over the
# tree, and the check failing on planted upward includes.
find_package(Python3 REQUIRED COMPONENTS Interpreter)
add_test(NAME layers.includes_point_down
  COMMAND Python3::Interpreter ${CMAKE_SOURCE_DIR}/scripts/check-layers.py --root ${CMAKE_SOURCE_DIR})
add_test(NAME layers.planted_upward_include_fails
  COMMAND Python3::Interpreter ${CMAKE_CURRENT_LIST_DIR}/check_layers_test.py ${CMAKE_SOURCE_DIR})
