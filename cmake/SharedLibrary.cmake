# The libraries as other programs get them: shared, with a version, only what is public to be seen.
if(CMAKE_LIBRARY_ARCHITECTURE AND EXISTS "${CMAKE_SYSROOT}/etc/debian_version")
  # Debian's linkers look there below /usr and /usr/local alike, so that libraries of several
  # processors can be installed at once. What is packaged is configured with another prefix.
  set(CMAKE_INSTALL_LIBDIR lib/${CMAKE_LIBRARY_ARCHITECTURE} CACHE PATH "Object code libraries")
endif()
include(GNUInstallDirs)
include(CMakePackageConfigHelpers)

# tally_shared_library(NAME DESCRIPTION text
#                      [HEADERS folder of include/]
#                      [LANGUAGE C]          of its headers and all that is in it; C++ by default
#                      [SOURCES file...]     compiled into it
#                      [WHOLE room...]       rooms that are in it as a whole
#                      [HIDDEN room...]      rooms of which it takes what it needs
#                      [NEEDS library...])   shared libraries of ours that its users see
# Makes libNAME.so and installs it as the component NAME; as NAME-dev its headers, a CMake package
# (NAME::NAME) and a pkg-config file.
function(tally_shared_library name)
  cmake_parse_arguments(LIB "" "DESCRIPTION;HEADERS;LANGUAGE" "SOURCES;WHOLE;HIDDEN;NEEDS" ${ARGN})
  set(exports ${PROJECT_SOURCE_DIR}/cmake/exports.map)
  list(TRANSFORM LIB_WHOLE REPLACE "(.+)" "$<LINK_LIBRARY:WHOLE_ARCHIVE,\\1>")

  add_library(${name} SHARED ${LIB_SOURCES})
  add_library(${name}::${name} ALIAS ${name})
  set_target_properties(${name} PROPERTIES
    VERSION ${PROJECT_VERSION} SOVERSION ${PROJECT_VERSION_MAJOR} LINK_DEPENDS ${exports})
  if(NOT LIB_LANGUAGE STREQUAL C)
    target_compile_features(${name} INTERFACE cxx_std_20)
  endif()
  target_include_directories(${name}
    PRIVATE ${PROJECT_SOURCE_DIR}/src
    PUBLIC $<BUILD_INTERFACE:${PROJECT_SOURCE_DIR}/include> $<INSTALL_INTERFACE:${CMAKE_INSTALL_INCLUDEDIR}>)
  # Shared ones between what refers to them and the archives: so they count as needed, and what they
  # define is not taken from the archives again.
  target_link_libraries(${name} PRIVATE ${LIB_WHOLE} PUBLIC ${LIB_NEEDS} PRIVATE ${LIB_HIDDEN})
  target_link_options(${name} PRIVATE -Wl,--version-script=${exports} -Wl,--no-undefined
    -Wl,-z,nodelete)  # SQLite keeps pointers to what the storage library registers with it

  install(TARGETS ${name} EXPORT ${name}Targets
    LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT ${name} NAMELINK_COMPONENT ${name}-dev)
  install(DIRECTORY ${PROJECT_SOURCE_DIR}/include/${LIB_HEADERS}
    DESTINATION ${CMAKE_INSTALL_INCLUDEDIR} COMPONENT ${name}-dev FILES_MATCHING PATTERN *.h)
  tally_install_package(${name} "${LIB_DESCRIPTION}" "${LIB_NEEDS}")
endfunction()

function(tally_install_package name description needs)
  set(package ${CMAKE_INSTALL_LIBDIR}/cmake/${name})
  set(built ${PROJECT_BINARY_DIR}/packages)
  set(find_dependencies)
  foreach(need ${needs})
    string(APPEND find_dependencies "find_dependency(${need})\n")
  endforeach()
  # The files say where they are by where they lie, so that a prefix can be moved.
  file(RELATIVE_PATH prefix_from_pkgconfig /${CMAKE_INSTALL_LIBDIR}/pkgconfig /)
  string(REPLACE ";" " " requires "${needs}")
  configure_file(${PROJECT_SOURCE_DIR}/cmake/package.pc.in ${built}/${name}.pc @ONLY)
  configure_package_config_file(${PROJECT_SOURCE_DIR}/cmake/Config.cmake.in
    ${built}/${name}Config.cmake INSTALL_DESTINATION ${package})
  write_basic_package_version_file(${built}/${name}ConfigVersion.cmake
    COMPATIBILITY SameMinorVersion)
  install(EXPORT ${name}Targets NAMESPACE ${name}:: DESTINATION ${package} COMPONENT ${name}-dev)
  install(FILES ${built}/${name}Config.cmake ${built}/${name}ConfigVersion.cmake
    DESTINATION ${package} COMPONENT ${name}-dev)
  install(FILES ${built}/${name}.pc
    DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig COMPONENT ${name}-dev)
endfunction()
