# Installs the modem for other CMake projects: the static core with its
# headers (find_package(Sorvel) gives Sorvel::sorvel_core), libSorvel.so for
# apps that load the JNI peers, and the package files.
include(CMakePackageConfigHelpers)

set(SORVEL_CMAKE_DIR ${CMAKE_INSTALL_LIBDIR}/cmake/Sorvel)
set(_sorvel_targets sorvel_core)
if(TARGET Sorvel)
  list(APPEND _sorvel_targets Sorvel)
endif()
install(TARGETS ${_sorvel_targets} EXPORT SorvelTargets
  ARCHIVE DESTINATION ${CMAKE_INSTALL_LIBDIR}
  LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR})
# The public headers keep their paths ("audio/modem_config.h"); the JNI
# peers' internals are not part of the C++ interface.
install(DIRECTORY base audio DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/sorvel
  FILES_MATCHING PATTERN "*.h"
  PATTERN "jni" EXCLUDE)
install(EXPORT SorvelTargets NAMESPACE Sorvel:: DESTINATION ${SORVEL_CMAKE_DIR})

configure_package_config_file(cmake/SorvelConfig.cmake.in
  ${CMAKE_CURRENT_BINARY_DIR}/SorvelConfig.cmake INSTALL_DESTINATION ${SORVEL_CMAKE_DIR})
write_basic_package_version_file(${CMAKE_CURRENT_BINARY_DIR}/SorvelConfigVersion.cmake
  COMPATIBILITY SameMinorVersion)
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/SorvelConfig.cmake
              ${CMAKE_CURRENT_BINARY_DIR}/SorvelConfigVersion.cmake
        DESTINATION ${SORVEL_CMAKE_DIR})
