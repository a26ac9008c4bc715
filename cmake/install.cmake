# What is installed: for C the header, the shared and the static library; for C++ the headers and
# archives of engine and volume; for both a CMake package and pkg-config files; and the program.
include(GNUInstallDirs)
include(CMakePackageConfigHelpers)

# The libraries people name. `engine`: trees, for drivers. `host`: the same with the platform's
# functions for a program. `volume`: besides, volumes in images, records and the checker. They
# gather the archives that the project is built in.
add_library(treehfs_api_engine INTERFACE)
target_link_libraries(treehfs_api_engine INTERFACE treehfs hfs_convert hfs_names velk_platform)
add_library(treehfs_api_host INTERFACE)
target_link_libraries(treehfs_api_host
  INTERFACE treehfs_api_engine $<LINK_GROUP:RESCAN,treehfs::treehfs,treehfs::velk_host>)
add_library(treehfs_api_volume INTERFACE)
target_link_libraries(treehfs_api_volume
  INTERFACE hfs_records hfs_volume hfs_check treehfs_api_host)
foreach(name engine host volume)
  set_target_properties(treehfs_api_${name} PROPERTIES EXPORT_NAME ${name})
  target_compile_features(treehfs_api_${name} INTERFACE cxx_std_20)
  add_library(treehfs::${name} ALIAS treehfs_api_${name})
endforeach()

set(archives treehfs velk_platform velk_host hfs_names hfs_names_text hfs_convert hfs_volume
  hfs_check hfs_records)
set(libraries ${archives} treehfs_api_engine treehfs_api_host treehfs_api_volume
  treehfs_c_static)
if(TARGET treehfs_c)
  list(APPEND libraries treehfs_c)
endif()
# C++ headers lie in a folder of their own and are included as within the project.
set(headers ${CMAKE_INSTALL_INCLUDEDIR}/treehfs/cxx)
set(package ${CMAKE_INSTALL_LIBDIR}/cmake/treehfs)

foreach(library ${archives})
  add_library(treehfs::${library} ALIAS ${library})
  target_include_directories(${library} INTERFACE $<INSTALL_INTERFACE:${headers}>)
endforeach()
foreach(library treehfs_c treehfs_c_static)
  if(TARGET ${library})
    target_include_directories(${library}
      INTERFACE $<INSTALL_INTERFACE:${CMAKE_INSTALL_INCLUDEDIR}>)
  endif()
endforeach()
install(TARGETS ${libraries} EXPORT treehfsTargets
  LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR} NAMELINK_COMPONENT development COMPONENT runtime
  ARCHIVE DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT development)
install(EXPORT treehfsTargets NAMESPACE treehfs:: DESTINATION ${package} COMPONENT development)

# The private headers of the engine, the checker and the volume layer stay behind.
set(CMAKE_INSTALL_DEFAULT_COMPONENT_NAME development)
install(FILES include/treehfs/treehfs.h DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/treehfs)
install(DIRECTORY src/platform DESTINATION ${headers} FILES_MATCHING PATTERN "*.h")
install(DIRECTORY src/hfs/records DESTINATION ${headers}/hfs FILES_MATCHING PATTERN "*.h")
foreach(header format fshfs treehfs names names_text check/check volume/block_device
    volume/convert volume/image_volume volume/make_volume volume/partition volume/problem
    volume/volume_header)
  cmake_path(GET header PARENT_PATH folder)
  install(FILES src/hfs/${header}.h DESTINATION ${headers}/hfs/${folder})
endforeach()

configure_package_config_file(cmake/treehfsConfig.cmake.in treehfsConfig.cmake
  INSTALL_DESTINATION ${package} NO_SET_AND_CHECK_MACRO)
write_basic_package_version_file(treehfsConfigVersion.cmake COMPATIBILITY SameMinorVersion)
install(FILES ${PROJECT_BINARY_DIR}/treehfsConfig.cmake
  ${PROJECT_BINARY_DIR}/treehfsConfigVersion.cmake DESTINATION ${package})
foreach(name treehfs treehfs-engine treehfs-volume)
  configure_file(cmake/${name}.pc.in ${name}.pc @ONLY)
  install(FILES ${PROJECT_BINARY_DIR}/${name}.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
endforeach()

if(TREEHFS_BUILD_TOOL)
  set(CMAKE_INSTALL_DEFAULT_COMPONENT_NAME program)
  install(TARGETS treehfs_cli RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR})
  # Completions are the program's own output, so they cannot fall behind it.
  set(completions ${PROJECT_BINARY_DIR}/completions)
  install(CODE "
    file(MAKE_DIRECTORY ${completions})
    foreach(shell bash zsh fish)
      execute_process(COMMAND $<TARGET_FILE:treehfs_cli> completion \${shell}
        OUTPUT_FILE ${completions}/treehfs.\${shell} COMMAND_ERROR_IS_FATAL ANY)
    endforeach()")
  install(FILES ${completions}/treehfs.bash RENAME treehfs
    DESTINATION ${CMAKE_INSTALL_DATADIR}/bash-completion/completions)
  install(FILES ${completions}/treehfs.zsh RENAME _treehfs
    DESTINATION ${CMAKE_INSTALL_DATADIR}/zsh/vendor-completions)
  install(FILES ${completions}/treehfs.fish
    DESTINATION ${CMAKE_INSTALL_DATADIR}/fish/vendor_completions.d)

  # Manual pages, where there is something to make them with.
  find_program(SCDOC scdoc)
  file(GLOB pages CONFIGURE_DEPENDS ${PROJECT_SOURCE_DIR}/docs/man/*.scd)
  if(SCDOC AND pages)
    set(made "")
    foreach(page ${pages})
      cmake_path(GET page STEM LAST_ONLY name)  # treehfs-ls.1
      set(manual ${PROJECT_BINARY_DIR}/man/${name})
      add_custom_command(OUTPUT ${manual} DEPENDS ${page} VERBATIM
        COMMAND ${CMAKE_COMMAND} -E make_directory ${PROJECT_BINARY_DIR}/man
        COMMAND sh -c "\"$1\" < \"$2\" > \"$3\"" sh ${SCDOC} ${page} ${manual})
      list(APPEND made ${manual})
      string(REGEX MATCH "[0-9]$" section ${name})
      install(FILES ${manual} DESTINATION ${CMAKE_INSTALL_MANDIR}/man${section})
    endforeach()
    add_custom_target(treehfs_man ALL DEPENDS ${made})
  endif()
endif()
