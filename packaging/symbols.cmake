# The symbols files of the library packages: what programs may link with, and since which version. The
# templates in debian/symbols name each function as it is written in C++; the types whose names differ
# between processors are filled in here.
set(size_t "unsigned long")
set(size_suffix ul)
set(dynamic_extent 18446744073709551615ul)
set(int64_t long)
if(CMAKE_SIZEOF_VOID_P EQUAL 4)
  set(size_t "unsigned int")
  set(size_suffix u)
  set(dynamic_extent 4294967295u)
  set(int64_t "long long")
endif()

set(CPACK_PRE_BUILD_SCRIPTS ${CMAKE_CURRENT_LIST_DIR}/make-symbols.cmake)
set(CPACK_TALLYRUN_VERSION ${package_version})
set(CPACK_TALLYRUN_SYMBOLS)

# Stores in the variable the path at which the package's symbols file is when it is put together.
function(tally_symbols_file component package variable)
  set(folder ${CMAKE_CURRENT_BINARY_DIR}/symbols/${package})
  configure_file(debian/symbols/${package}.in ${folder}/template @ONLY)
  set(CPACK_TALLYRUN_SYMBOLS ${CPACK_TALLYRUN_SYMBOLS} "${component}|${package}|${folder}" PARENT_SCOPE)
  set(${variable} ${folder}/symbols PARENT_SCOPE)
endfunction()
