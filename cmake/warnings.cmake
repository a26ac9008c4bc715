# Options every target of the project is compiled with.
add_library(treehfs_options INTERFACE)
target_compile_options(treehfs_options INTERFACE
  -Wall -Wextra -Wpedantic -Wshadow -Wconversion -Wsign-conversion -Werror)
target_include_directories(treehfs_options INTERFACE ${PROJECT_SOURCE_DIR}/src)

# What the engine and the platform code beneath it are compiled with besides.
add_library(treehfs_engine_options INTERFACE)
target_link_libraries(treehfs_engine_options INTERFACE treehfs_options)
target_compile_options(treehfs_engine_options INTERFACE -fno-exceptions -fno-rtti)
