# Installs the build into a folder of its own and builds, links and runs the example against it,
# outside the project: by its CMake package, and by pkg-config where that is installed.
function(run)
  execute_process(COMMAND ${ARGN} RESULT_VARIABLE status OUTPUT_VARIABLE text ERROR_VARIABLE text)
  if(NOT status EQUAL 0)
    message(FATAL_ERROR "${ARGN}\n${text}")
  endif()
endfunction()

file(REMOVE_RECURSE ${WORK})
set(flags "")
if(SANITIZE)
  string(APPEND flags " -fsanitize=address,undefined")
endif()
if(COVERAGE)
  string(APPEND flags " --coverage")
endif()

run(${CMAKE_COMMAND} --install ${BUILD} --prefix ${WORK}/prefix)
file(COPY ${EXAMPLE} DESTINATION ${WORK})
run(${CMAKE_COMMAND} -S ${WORK}/ram_volume -B ${WORK}/build -D CMAKE_CXX_COMPILER=${COMPILER}
  -D "CMAKE_CXX_FLAGS=${flags}" -D CMAKE_PREFIX_PATH=${WORK}/prefix)
run(${CMAKE_COMMAND} --build ${WORK}/build)
run(${WORK}/build/ram_volume)

find_program(PKG_CONFIG pkg-config)
if(PKG_CONFIG)
  file(GLOB folder ${WORK}/prefix/lib*/pkgconfig ${WORK}/prefix/lib/*/pkgconfig)
  execute_process(COMMAND ${CMAKE_COMMAND} -E env PKG_CONFIG_PATH=${folder}
    ${PKG_CONFIG} --define-prefix --libs treehfs
    RESULT_VARIABLE status OUTPUT_VARIABLE libs)
  if(NOT status EQUAL 0 OR NOT libs MATCHES "-ltreehfs")
    message(FATAL_ERROR "pkg-config: '${libs}'")
  endif()
endif()
