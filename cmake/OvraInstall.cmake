# Installation rules, and the packages by which other projects find the library.
include(CMakePackageConfigHelpers)

set(ovra_installed ovradrcore ovradrnode)
if(TARGET ovradrplatform AND OVRADRNODE_PLATFORM STREQUAL "linux")
  list(APPEND ovra_installed ovradrplatform)
endif()
install(TARGETS ${ovra_installed} EXPORT OvraDRNodeTargets
  LIBRARY DESTINATION "${CMAKE_INSTALL_LIBDIR}")
install(DIRECTORY include/ovradrnode core/include/ovradrcore
  DESTINATION "${CMAKE_INSTALL_INCLUDEDIR}" FILES_MATCHING PATTERN "*.h")
# The files for setting up an appliance: by ovradr, or by the vendor's package where there is none.
install(FILES src/db/node.sql DESTINATION "${CMAKE_INSTALL_DATADIR}/ovradrnode")
install(PROGRAMS scripts/TestDownloadSpeed.sh scripts/TestSyncSpeed.sh
  DESTINATION "${CMAKE_INSTALL_DATADIR}/ovradrnode")

set(ovra_cmake_dir "${CMAKE_INSTALL_LIBDIR}/cmake/OvraDRNode")
install(EXPORT OvraDRNodeTargets NAMESPACE OvraDRNode:: DESTINATION "${ovra_cmake_dir}")
configure_package_config_file(cmake/OvraDRNodeConfig.cmake.in
  "${PROJECT_BINARY_DIR}/OvraDRNodeConfig.cmake" INSTALL_DESTINATION "${ovra_cmake_dir}")
write_basic_package_version_file("${PROJECT_BINARY_DIR}/OvraDRNodeConfigVersion.cmake"
  COMPATIBILITY SameMajorVersion)
install(FILES "${PROJECT_BINARY_DIR}/OvraDRNodeConfig.cmake"
              "${PROJECT_BINARY_DIR}/OvraDRNodeConfigVersion.cmake"
  DESTINATION "${ovra_cmake_dir}")

# systemd looks for them below /usr/lib and /usr/local/lib, whatever the architecture.
if(TARGET ovradrd)
  foreach(daemon ovradrd farlinkd)
    configure_file("dist/systemd/${daemon}.service.in" "${PROJECT_BINARY_DIR}/${daemon}.service" @ONLY)
    install(FILES "${PROJECT_BINARY_DIR}/${daemon}.service" DESTINATION lib/systemd/system)
  endforeach()
  install(FILES dist/systemd/ovradr.tmpfiles DESTINATION lib/tmpfiles.d RENAME ovradr.conf)
  install(FILES dist/systemd/farlinkd.sysusers DESTINATION lib/sysusers.d RENAME farlinkd.conf)
endif()

# The packages are relocatable, so an installed tree can be moved.
file(RELATIVE_PATH ovra_pc_to_prefix
  "/prefix/${CMAKE_INSTALL_LIBDIR}/pkgconfig" "/prefix")
foreach(package ovradrcore ovradrnode)
  configure_file("cmake/${package}.pc.in" "${PROJECT_BINARY_DIR}/${package}.pc" @ONLY)
  install(FILES "${PROJECT_BINARY_DIR}/${package}.pc"
    DESTINATION "${CMAKE_INSTALL_LIBDIR}/pkgconfig")
endforeach()
