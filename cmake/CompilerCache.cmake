# Builds from the compiler cache where there is one. Objects are the same wherever a clone lies, so a
# second clone is built from what the first one left. The launcher stays out of the compile database.
option(TALLYRUN_COMPILER_CACHE "Build from ccache, if it is installed" OFF)

find_program(TALLYRUN_CCACHE ccache)
if(TALLYRUN_COMPILER_CACHE AND TALLYRUN_CCACHE)
  set_property(GLOBAL PROPERTY RULE_LAUNCH_COMPILE
    "${CMAKE_COMMAND} -E env CCACHE_BASEDIR=${CMAKE_SOURCE_DIR} CCACHE_NOHASHDIR=1 ${TALLYRUN_CCACHE}")
endif()
