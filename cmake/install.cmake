# What a driver author installs: headers, libraries, the CMake package and a pkg-config file.
include(GNUInstallDirs)
include(CMakePackageConfigHelpers)

set(libraries treehfs velk_platform velk_host hfs_names hfs_convert)
set(headers ${CMAKE_INSTALL_INCLUDEDIR}/treehfs)
set(package ${CMAKE_INSTALL_LIBDIR}/cmake/treehfs)

foreach(library ${libraries})
  add_library(treehfs::${library} ALIAS ${library})
  target_include_directories(${library} INTERFACE $<INSTALL_INTERFACE:${headers}>)
endforeach()
install(TARGETS ${libraries} EXPORT treehfsTargets
  ARCHIVE DESTINATION ${CMAKE_INSTALL_LIBDIR})
install(EXPORT treehfsTargets NAMESPACE treehfs:: DESTINATION ${package})

# The private headers of the engine and the volume layer's own stay behind, but for the conversion
# hooks.
install(DIRECTORY ${PROJECT_SOURCE_DIR}/src/platform DESTINATION ${headers}
  FILES_MATCHING PATTERN "*.h")
install(FILES src/hfs/format.h src/hfs/fshfs.h src/hfs/treehfs.h src/hfs/names.h
  DESTINATION ${headers}/hfs)
install(FILES src/hfs/volume/convert.h DESTINATION ${headers}/hfs/volume)

configure_package_config_file(cmake/treehfsConfig.cmake.in treehfsConfig.cmake
  INSTALL_DESTINATION ${package} NO_SET_AND_CHECK_MACRO NO_CHECK_REQUIRED_COMPONENTS_MACRO)
write_basic_package_version_file(treehfsConfigVersion.cmake COMPATIBILITY SameMinorVersion)
configure_file(cmake/treehfs.pc.in treehfs.pc @ONLY)
install(FILES ${PROJECT_BINARY_DIR}/treehfsConfig.cmake
  ${PROJECT_BINARY_DIR}/treehfsConfigVersion.cmake DESTINATION ${package})
install(FILES ${PROJECT_BINARY_DIR}/treehfs.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)

if(TREEHFS_BUILD_TOOL)
  install(TARGETS treehfs_cli RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR})
endif()
