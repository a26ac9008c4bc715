# Changes to trees: insertion, sharing, splits, update, deletion.
add_executable(change_tests
  balance_test.cpp
  change_damage_test.cpp
  change_fault_test.cpp
  change_hostile_test.cpp
  churn_test.cpp
  delete_test.cpp
  flat_tree.cpp
  hand_over_test.cpp
  hazard_test.cpp
  insert_left_test.cpp
  insert_refusal_test.cpp
  insert_test.cpp
  lockstep_test.cpp
  next_node_test.cpp
  own_change_test.cpp
  plain_change_test.cpp
  record_delete_test.cpp
  record_insert_test.cpp
  record_move_test.cpp
  shared_buffers_test.cpp
  split_limits_test.cpp
  update_test.cpp
)
target_link_libraries(change_tests PRIVATE test_support treehfs velk_host GTest::gtest_main)
add_test(NAME change_tests COMMAND change_tests)
set_tests_properties(change_tests PROPERTIES TIMEOUT 300)
