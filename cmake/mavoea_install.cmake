# What is installed for programs that use the libraries: the libraries themselves, shared and
# static, their headers, a pkg-config file for each, and a CMake package with the targets
#
#   mavoea::mavoea         the shared library
#   mavoea::mavoea_static  the static one
#   mavoea::mavocore, mavoea::mavoacl and their _static: the host's platform libraries
#
# All of it finds the rest from where it is itself, so that an installed tree can be copied.

include(CMakePackageConfigHelpers)

set(MAVOEA_PACKAGE_DIR ${CMAKE_INSTALL_LIBDIR}/cmake/mavoea)
set(MAVOEA_CMAKE_DIR ${CMAKE_CURRENT_LIST_DIR})

# Installs a library, shared (target NAME) and static (NAME_static), the header NAME.h of
# `directory`, and NAME.pc with the other arguments as its fields.
function(mavoea_install_library name directory)
  set(fields DESCRIPTION REQUIRES REQUIRES_PRIVATE LIBS LIBS_PRIVATE)
  cmake_parse_arguments(PARSE_ARGV 2 PC "" "${fields}" "")
  foreach(target ${name} ${name}_static)
    target_include_directories(${target} INTERFACE
      $<BUILD_INTERFACE:${directory}> $<INSTALL_INTERFACE:${CMAKE_INSTALL_INCLUDEDIR}>)
  endforeach()
  set_target_properties(${name}_static PROPERTIES OUTPUT_NAME ${name})
  install(TARGETS ${name} ${name}_static EXPORT mavoea
          LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR}
          ARCHIVE DESTINATION ${CMAKE_INSTALL_LIBDIR})
  install(FILES ${directory}/${name}.h DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})

  get_target_property(version ${name} VERSION)
  file(RELATIVE_PATH to_prefix ${CMAKE_INSTALL_FULL_LIBDIR}/pkgconfig ${CMAKE_INSTALL_PREFIX})
  file(RELATIVE_PATH to_lib ${CMAKE_INSTALL_PREFIX} ${CMAKE_INSTALL_FULL_LIBDIR})
  file(RELATIVE_PATH to_include ${CMAKE_INSTALL_PREFIX} ${CMAKE_INSTALL_FULL_INCLUDEDIR})
  string(REGEX REPLACE "/$" "" to_prefix ${to_prefix})
  configure_file(${MAVOEA_CMAKE_DIR}/library.pc.in ${CMAKE_BINARY_DIR}/${name}.pc @ONLY)
  install(FILES ${CMAKE_BINARY_DIR}/${name}.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
endfunction()

# What find_package(mavoea) reads.
function(mavoea_install_package)
  install(EXPORT mavoea DESTINATION ${MAVOEA_PACKAGE_DIR} NAMESPACE mavoea::
          FILE mavoeaTargets.cmake)
  configure_package_config_file(${MAVOEA_CMAKE_DIR}/mavoeaConfig.cmake.in
    ${CMAKE_BINARY_DIR}/mavoeaConfig.cmake INSTALL_DESTINATION ${MAVOEA_PACKAGE_DIR}
    NO_SET_AND_CHECK_MACRO)
  write_basic_package_version_file(${CMAKE_BINARY_DIR}/mavoeaConfigVersion.cmake
                                   COMPATIBILITY SameMajorVersion)
  install(FILES ${CMAKE_BINARY_DIR}/mavoeaConfig.cmake
                ${CMAKE_BINARY_DIR}/mavoeaConfigVersion.cmake
          DESTINATION ${MAVOEA_PACKAGE_DIR})
endfunction()
