# The tally of sites: each run of the engine's tests leaves what it saw, the last test adds it up.
# Every site of the engine has its test or a reason why nothing reaches it.
find_package(Python3 REQUIRED COMPONENTS Interpreter)
set(tally_dir ${CMAKE_CURRENT_BINARY_DIR}/sites_seen)
add_test(NAME engine_sites_clear COMMAND ${CMAKE_COMMAND} -E rm -rf ${tally_dir})
add_test(NAME engine_sites_dir COMMAND ${CMAKE_COMMAND} -E make_directory ${tally_dir})
set_tests_properties(engine_sites_clear PROPERTIES FIXTURES_SETUP engine_sites_clear)
set_tests_properties(engine_sites_dir PROPERTIES FIXTURES_SETUP engine_sites_dir
  FIXTURES_REQUIRED engine_sites_clear)
set_tests_properties(engine_tests space_tests change_tests PROPERTIES
  ENVIRONMENT TREEHFS_SITES_DIR=${tally_dir}
  FIXTURES_REQUIRED engine_sites_dir
  FIXTURES_SETUP engine_sites)
file(GLOB engine_sources RELATIVE ${PROJECT_SOURCE_DIR}/src/hfs/treehfs
  ${PROJECT_SOURCE_DIR}/src/hfs/treehfs/*.cpp)
add_test(NAME engine_sites COMMAND Python3::Interpreter
  ${CMAKE_CURRENT_SOURCE_DIR}/sites_reached.py ${PROJECT_SOURCE_DIR}/docs/sites.txt ${tally_dir}
  ${engine_sources})
set_tests_properties(engine_sites PROPERTIES FIXTURES_REQUIRED engine_sites)
