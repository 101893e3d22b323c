# Installs the library, its headers under include/corvlumex/ with the source
# layout, a pkg-config file and a CMake package config.
include(CMakePackageConfigHelpers)

install(TARGETS fileindex EXPORT fileindexTargets
  LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR}
  INCLUDES DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/corvlumex)

foreach(part common fileindex sdk platform)
  install(DIRECTORY ${PROJECT_SOURCE_DIR}/${part}/
    DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/corvlumex/${part}
    FILES_MATCHING PATTERN "*.h")
endforeach()

install(EXPORT fileindexTargets NAMESPACE fileindex::
  DESTINATION ${CMAKE_INSTALL_LIBDIR}/cmake/fileindex)
configure_package_config_file(${PROJECT_SOURCE_DIR}/cmake/fileindexConfig.cmake.in
  ${PROJECT_BINARY_DIR}/fileindexConfig.cmake
  INSTALL_DESTINATION ${CMAKE_INSTALL_LIBDIR}/cmake/fileindex)
write_basic_package_version_file(${PROJECT_BINARY_DIR}/fileindexConfigVersion.cmake
  COMPATIBILITY SameMajorVersion)
install(FILES ${PROJECT_BINARY_DIR}/fileindexConfig.cmake ${PROJECT_BINARY_DIR}/fileindexConfigVersion.cmake
  DESTINATION ${CMAKE_INSTALL_LIBDIR}/cmake/fileindex)

configure_file(${PROJECT_SOURCE_DIR}/cmake/fileindex.pc.in ${PROJECT_BINARY_DIR}/fileindex.pc @ONLY)
install(FILES ${PROJECT_BINARY_DIR}/fileindex.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
