# The library as it is installed, and what CMake and pkg-config need to find it.

include(CMakePackageConfigHelpers)

set(header_dir ${CMAKE_INSTALL_INCLUDEDIR}/vemo-access-token)
install(TARGETS vemoaccesstoken EXPORT VemoAccessTokenTargets
        LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR}
        INCLUDES DESTINATION ${header_dir})
install(FILES
          ${PROJECT_SOURCE_DIR}/include/AccessTokenApi.h
          ${PROJECT_SOURCE_DIR}/include/AccessTokenDefine.h
          ${PROJECT_SOURCE_DIR}/include/AccessTokenUtil.h
          ${PROJECT_SOURCE_DIR}/include/AccessTokens.h
          ${PROJECT_SOURCE_DIR}/include/CallLock.h
          ${PROJECT_SOURCE_DIR}/include/vemo-access-token.h
        DESTINATION ${header_dir})
# The one internal header whose class is exported.
install(FILES ${PROJECT_SOURCE_DIR}/include/internal/AccessTokenDbApi.h DESTINATION ${header_dir}/internal)

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
