# `cmake --install`: libraries, headers, the tool, a pkg-config file and a CMake package.

install(TARGETS kt_ku kt_tr kt_pmsg kt_rg EXPORT kt_rg_targets LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR})
file(GLOB KT_PUBLIC_HEADERS ${PROJECT_SOURCE_DIR}/include/kt_*.h ${PROJECT_SOURCE_DIR}/include/kt_*.hpp)
install(FILES ${KT_PUBLIC_HEADERS} DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})
if(TARGET ktrg)
  install(TARGETS ktrg RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR})
endif()

# The pkg-config file finds the prefix from where it lies itself, so `cmake --install --prefix` may go anywhere.
file(RELATIVE_PATH KT_PKGCONFIG_TO_PREFIX /prefix/${CMAKE_INSTALL_LIBDIR}/pkgconfig /prefix)
configure_file(${PROJECT_SOURCE_DIR}/cmake/kt_rg.pc.in ${CMAKE_BINARY_DIR}/kt_rg.pc @ONLY)
install(FILES ${CMAKE_BINARY_DIR}/kt_rg.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)

install(EXPORT kt_rg_targets NAMESPACE kt_rg:: FILE kt_rg-targets.cmake
        DESTINATION ${CMAKE_INSTALL_LIBDIR}/cmake/kt_rg)
configure_package_config_file(${PROJECT_SOURCE_DIR}/cmake/kt_rg-config.cmake.in ${CMAKE_BINARY_DIR}/kt_rg-config.cmake
                              INSTALL_DESTINATION ${CMAKE_INSTALL_LIBDIR}/cmake/kt_rg)
write_basic_package_version_file(${CMAKE_BINARY_DIR}/kt_rg-config-version.cmake COMPATIBILITY SameMajorVersion)
install(FILES ${CMAKE_BINARY_DIR}/kt_rg-config.cmake ${CMAKE_BINARY_DIR}/kt_rg-config-version.cmake
        DESTINATION ${CMAKE_INSTALL_LIBDIR}/cmake/kt_rg)
