# Generates the name tables once more and compares them with the ones in the repository.
file(MAKE_DIRECTORY ${WORK})
execute_process(COMMAND ${PYTHON} ${SOURCE}/tools/make_name_tables.py ${WORK}
  COMMAND_ERROR_IS_FATAL ANY)
foreach(table names_fold names_decompose names_compose)
  execute_process(COMMAND ${CMAKE_COMMAND} -E compare_files ${SOURCE}/src/hfs/${table}.inc
    ${WORK}/${table}.inc RESULT_VARIABLE differs)
  if(differs)
    message(FATAL_ERROR "src/hfs/${table}.inc is not what tools/make_name_tables.py makes")
  endif()
endforeach()
