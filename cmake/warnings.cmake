# Whether a warning ends the build, as all presets have it. Not where others build the project:
# their compilers and options (a distribution's hardening, -O3) bring warnings that nobody here has
# seen.
option(TREEHFS_WARNINGS_END_BUILD "Treat warnings as errors" OFF)

# Options every target of the project is compiled with.
add_library(treehfs_options INTERFACE)
target_compile_options(treehfs_options INTERFACE
  -Wall -Wextra -Wpedantic -Wshadow -Wconversion -Wsign-conversion
  $<$<BOOL:${TREEHFS_WARNINGS_END_BUILD}>:-Werror>)
target_include_directories(treehfs_options INTERFACE ${PROJECT_SOURCE_DIR}/src)

# What the engine and the platform code beneath it are compiled with besides.
add_library(treehfs_engine_options INTERFACE)
target_link_libraries(treehfs_engine_options INTERFACE treehfs_options)
target_compile_options(treehfs_engine_options INTERFACE -fno-exceptions -fno-rtti)

# Libraries whose objects also go into the shared library: position-independent, and with no symbol
# of their own to offer there.
function(treehfs_share)
  set_target_properties(${ARGN} PROPERTIES POSITION_INDEPENDENT_CODE ON)
  # An engine that is a library of its own and the tests that load it see each other's symbols.
  if(NOT TREEHFS_ENGINE_SHARED)
    set_target_properties(${ARGN} PROPERTIES
      CXX_VISIBILITY_PRESET hidden VISIBILITY_INLINES_HIDDEN ON)
  endif()
endfunction()

# A static library that is installed: as libtreehfs_NAME.a, so that its origin shows.
function(treehfs_archive target name)
  treehfs_share(${target})
  set_target_properties(${target} PROPERTIES OUTPUT_NAME treehfs_${name})
endfunction()
