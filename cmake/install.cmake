# What `cmake --install` puts where: the library and its headers, a pkg-config file and a CMake
# package for consumers. The tools add their own rules.
include(CMakePackageConfigHelpers)

set(FILEINDEX_CMAKE_DIR ${CMAKE_INSTALL_LIBDIR}/cmake/fileindex)

set_target_properties(fileindex PROPERTIES EXPORT_NAME fileindex)
install(TARGETS fileindex EXPORT fileindexTargets
  LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR})
install(DIRECTORY include/fileindex DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})

install(EXPORT fileindexTargets
  NAMESPACE fileindex::
  DESTINATION ${FILEINDEX_CMAKE_DIR})
configure_package_config_file(cmake/fileindexConfig.cmake.in
  ${PROJECT_BINARY_DIR}/fileindexConfig.cmake
  INSTALL_DESTINATION ${FILEINDEX_CMAKE_DIR})
# The SONAME carries the major version, so a package of the same major version is compatible.
write_basic_package_version_file(${PROJECT_BINARY_DIR}/fileindexConfigVersion.cmake
  VERSION ${PROJECT_VERSION}
  COMPATIBILITY SameMajorVersion)
install(FILES
  ${PROJECT_BINARY_DIR}/fileindexConfig.cmake
  ${PROJECT_BINARY_DIR}/fileindexConfigVersion.cmake
  DESTINATION ${FILEINDEX_CMAKE_DIR})

# The pkg-config file names the prefix the tree is installed under, which `cmake --install
# --prefix` may change after configuring: it is written at install time.
install(CODE "
  set(FILEINDEX_PC_PREFIX \"\${CMAKE_INSTALL_PREFIX}\")
  set(FILEINDEX_PC_LIBDIR \"${CMAKE_INSTALL_LIBDIR}\")
  set(FILEINDEX_PC_INCLUDEDIR \"${CMAKE_INSTALL_INCLUDEDIR}\")
  set(FILEINDEX_PC_VERSION \"${PROJECT_VERSION}\")
  foreach(dir LIBDIR INCLUDEDIR)
    if(NOT IS_ABSOLUTE \"\${FILEINDEX_PC_\${dir}}\")
      set(FILEINDEX_PC_\${dir} \"\\\${prefix}/\${FILEINDEX_PC_\${dir}}\")
    endif()
  endforeach()
  configure_file(\"${PROJECT_SOURCE_DIR}/cmake/fileindex.pc.in\"
    \"${PROJECT_BINARY_DIR}/pkgconfig/fileindex.pc\" @ONLY)
  file(INSTALL DESTINATION \"\${CMAKE_INSTALL_PREFIX}/${CMAKE_INSTALL_LIBDIR}/pkgconfig\"
    TYPE FILE FILES \"${PROJECT_BINARY_DIR}/pkgconfig/fileindex.pc\")
")
