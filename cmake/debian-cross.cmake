# Builds for another Debian architecture, against the sysroot that scripts/sysroot makes, with Debian's
# cross compiler; tests run under qemu's user mode. Included by the toolchain file of each architecture,
# which sets CMAKE_SYSTEM_PROCESSOR, tally_architecture, tally_triplet and tally_emulator.
set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSROOT ${CMAKE_CURRENT_LIST_DIR}/../build-${tally_architecture}/sysroot)
file(REAL_PATH ${CMAKE_SYSROOT} CMAKE_SYSROOT)
set(CMAKE_LIBRARY_ARCHITECTURE ${tally_triplet})
set(CMAKE_CXX_COMPILER ${tally_triplet}-g++)
set(CMAKE_C_COMPILER ${tally_triplet}-gcc)

# Programs are the host's; headers, libraries and packages are the sysroot's alone.
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_PACKAGE ONLY)
set(ENV{PKG_CONFIG_SYSROOT_DIR} ${CMAKE_SYSROOT})
set(ENV{PKG_CONFIG_LIBDIR}
    ${CMAKE_SYSROOT}/usr/lib/${tally_triplet}/pkgconfig:${CMAKE_SYSROOT}/usr/share/pkgconfig)

# With its path, since tests run programs with a search path of their own.
find_program(TALLYRUN_EMULATOR ${tally_emulator} REQUIRED)
set(CMAKE_CROSSCOMPILING_EMULATOR ${TALLYRUN_EMULATOR};-L;${CMAKE_SYSROOT})
