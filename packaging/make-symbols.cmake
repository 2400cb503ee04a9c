# Run by cpack between the installation into the packages' directories and the making of the packages.
# A symbol that is gone, or one that its template does not name, ends it: programs would break, or come
# to rely on what nobody promised.
foreach(library ${CPACK_TALLYRUN_SYMBOLS})
  string(REPLACE "|" ";" fields "${library}")
  list(POP_FRONT fields component package folder)
  if(NOT EXISTS ${CPACK_TEMPORARY_DIRECTORY}/${component})
    continue()
  endif()
  file(GLOB_RECURSE libraries ${CPACK_TEMPORARY_DIRECTORY}/${component}/*.so.*)
  list(TRANSFORM libraries PREPEND -e)
  set(architecture)
  if(CPACK_DEBIAN_PACKAGE_ARCHITECTURE)
    set(architecture -a${CPACK_DEBIAN_PACKAGE_ARCHITECTURE})
  endif()
  execute_process(
    COMMAND dpkg-gensymbols -c4 ${architecture} -p${package} -v${CPACK_TALLYRUN_VERSION}
      -P${CPACK_TEMPORARY_DIRECTORY}/${component} -I${folder}/template -O${folder}/symbols ${libraries}
    WORKING_DIRECTORY ${folder} OUTPUT_VARIABLE differences ERROR_VARIABLE messages
    RESULT_VARIABLE status)
  if(NOT status EQUAL 0)
    message(FATAL_ERROR "debian/symbols/${package}.in does not say what the library exports:\n"
      "${differences}${messages}")
  endif()
endforeach()
