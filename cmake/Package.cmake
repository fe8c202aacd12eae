# What CMake and pkg-config need to find the installed library.

include(CMakePackageConfigHelpers)

set(package_dir ${CMAKE_INSTALL_LIBDIR}/cmake/VemoAccessToken)
configure_package_config_file(${CMAKE_CURRENT_LIST_DIR}/VemoAccessTokenConfig.cmake.in VemoAccessTokenConfig.cmake
                              INSTALL_DESTINATION ${package_dir})
write_basic_package_version_file(VemoAccessTokenConfigVersion.cmake COMPATIBILITY SameMajorVersion)
install(FILES ${PROJECT_BINARY_DIR}/VemoAccessTokenConfig.cmake
              ${PROJECT_BINARY_DIR}/VemoAccessTokenConfigVersion.cmake
        DESTINATION ${package_dir})
install(EXPORT VemoAccessTokenTargets NAMESPACE VemoAccessToken:: DESTINATION ${package_dir})

# Relative to itself, so that it is right wherever the files are installed to.
set(pkgconfig_dir ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
file(RELATIVE_PATH prefix_from_pc /prefix/${pkgconfig_dir} /prefix)
string(REGEX REPLACE "/$" "" prefix_from_pc "${prefix_from_pc}")
configure_file(${CMAKE_CURRENT_LIST_DIR}/vemo-access-token.pc.in vemo-access-token.pc @ONLY)
install(FILES ${PROJECT_BINARY_DIR}/vemo-access-token.pc DESTINATION ${pkgconfig_dir})
