include(CMakePackageConfigHelpers)

get_property(vx_headers GLOBAL PROPERTY VX_PUBLIC_HEADERS)
install(FILES ${vx_headers} include/vxcore3/vxcore3.h DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/vxcore3)
install(TARGETS vxcore3 EXPORT vxcore3Targets
        LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR}
        INCLUDES DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})
install(EXPORT vxcore3Targets NAMESPACE vxcore3:: DESTINATION ${CMAKE_INSTALL_LIBDIR}/cmake/vxcore3)
configure_package_config_file(cmake/vxcore3Config.cmake.in
                              ${CMAKE_CURRENT_BINARY_DIR}/vxcore3Config.cmake
                              INSTALL_DESTINATION ${CMAKE_INSTALL_LIBDIR}/cmake/vxcore3)
write_basic_package_version_file(${CMAKE_CURRENT_BINARY_DIR}/vxcore3ConfigVersion.cmake
                                 COMPATIBILITY SameMajorVersion)
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/vxcore3Config.cmake
              ${CMAKE_CURRENT_BINARY_DIR}/vxcore3ConfigVersion.cmake
        DESTINATION ${CMAKE_INSTALL_LIBDIR}/cmake/vxcore3)
configure_file(cmake/vxcore3.pc.in ${CMAKE_CURRENT_BINARY_DIR}/vxcore3.pc @ONLY)
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/vxcore3.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
