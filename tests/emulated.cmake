# What is tested of a build for another processor besides its rooms, which run under the emulator by
# themselves. The walk over failing calls is left out: it looks at the order of the program's calls,
# which is the same everywhere, and 32-bit systems have other names for them.

# The programs under the emulator, as the end-to-end tests call them.
set(emulated ${CMAKE_BINARY_DIR}/emulated)
string(REPLACE ";" " " emulator "${CMAKE_CROSSCOMPILING_EMULATOR}")
foreach(program tallyrun tallyctl)
  # The library that pins the clock is the host's and works on the emulator; what is emulated could not
  # load it.
  file(CONFIGURE OUTPUT ${emulated}/${program} @ONLY CONTENT "#!/bin/sh
exec @emulator@ -U LD_PRELOAD @CMAKE_RUNTIME_OUTPUT_DIRECTORY@/@program@ \"$@\"
")
  file(CHMOD ${emulated}/${program} PERMISSIONS OWNER_READ OWNER_WRITE OWNER_EXECUTE)
endforeach()

foreach(script test_days test_storage same_as_native)
  add_test(NAME e2e.${script}
    COMMAND ${Python3_EXECUTABLE} ${CMAKE_CURRENT_SOURCE_DIR}/e2e/${script}.py -v)
  set_tests_properties(e2e.${script} PROPERTIES TIMEOUT 600
    ENVIRONMENT "TALLYRUN_BIN=${emulated};TALLYRUN_NATIVE_BIN=${CMAKE_SOURCE_DIR}/build/bin")
endforeach()
