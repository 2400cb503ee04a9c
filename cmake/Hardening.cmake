# What compiler and linker add against memory faults, in the programs and the libraries alike.
# docs/decisions.md says what it costs.
include(CheckPIESupported)
check_pie_supported()

option(TALLYRUN_BIND_NOW "Resolve every symbol at start-up, so that their addresses are read-only" ON)

add_compile_options(-fstack-protector-strong)
add_compile_definitions(_GLIBCXX_ASSERTIONS)
add_link_options(-Wl,-z,relro)
if(TALLYRUN_BIND_NOW)
  add_link_options(-Wl,-z,now)
endif()
# The sanitizers intercept the plain calls; without optimization the C library has nothing to check
# with, and warns. A distribution that chose a level in its flags keeps it.
if(NOT TALLYRUN_SANITIZE AND NOT CMAKE_CXX_FLAGS MATCHES "_FORTIFY_SOURCE")
  add_compile_options("$<$<NOT:$<CONFIG:Debug>>:-U_FORTIFY_SOURCE;-D_FORTIFY_SOURCE=2>")
endif()
