# What `cmake --install` puts in place: the public headers, libzantiff with
# the reference host (libpivlo) and the codec library it needs at run time
# (libosttiff), the zantiff tool, a CMake package (find_package(zantiff 1.1
# CONFIG) -> zantiff::zantiff) and zantiff.pc for pkg-config.
include(CMakePackageConfigHelpers)

install(DIRECTORY ${PROJECT_SOURCE_DIR}/include/zantiff DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})
install(FILES ${PROJECT_SOURCE_DIR}/platform/host/include/pivlo/pivlo.h
        DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/pivlo)

install(TARGETS libzantiff pivlo osttiff EXPORT zantiffTargets
        LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR} NAMELINK_COMPONENT Development
        RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR}
        INCLUDES DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})
install(TARGETS zantiff_tool RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR})

set(ZANTIFF_CMAKE_DIR ${CMAKE_INSTALL_LIBDIR}/cmake/zantiff)
install(EXPORT zantiffTargets NAMESPACE zantiff:: DESTINATION ${ZANTIFF_CMAKE_DIR})
configure_package_config_file(${PROJECT_SOURCE_DIR}/cmake/zantiffConfig.cmake.in
  ${PROJECT_BINARY_DIR}/zantiffConfig.cmake INSTALL_DESTINATION ${ZANTIFF_CMAKE_DIR})
write_basic_package_version_file(${PROJECT_BINARY_DIR}/zantiffConfigVersion.cmake
  COMPATIBILITY SameMajorVersion)
install(FILES ${PROJECT_BINARY_DIR}/zantiffConfig.cmake ${PROJECT_BINARY_DIR}/zantiffConfigVersion.cmake
        DESTINATION ${ZANTIFF_CMAKE_DIR})

# The prefix as seen from the .pc file, so that the package can be installed
# (and moved) anywhere.
file(RELATIVE_PATH ZANTIFF_PC_TO_PREFIX "/${CMAKE_INSTALL_LIBDIR}/pkgconfig" "/")
string(REGEX REPLACE "/$" "" ZANTIFF_PC_TO_PREFIX "${ZANTIFF_PC_TO_PREFIX}")
configure_file(${PROJECT_SOURCE_DIR}/cmake/zantiff.pc.in ${PROJECT_BINARY_DIR}/zantiff.pc @ONLY)
install(FILES ${PROJECT_BINARY_DIR}/zantiff.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
