# The installed tree: the library, its header, a CMake package and a pkg-config file. Both ways of
# finding it give the same include folder, so that hosts write #include <img.h>; both follow the
# tree when it is moved.
include(CMakePackageConfigHelpers)
include(GNUInstallDirs)

set(package_dir ${CMAKE_INSTALL_LIBDIR}/cmake/imgfile)
install(TARGETS imgfile
    EXPORT imgfile_targets
    FILE_SET HEADERS DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/imgfile)
install(EXPORT imgfile_targets
    FILE imgfileConfig.cmake  # nothing else to find: the targets are the package
    NAMESPACE imgfile::
    DESTINATION ${package_dir})
write_basic_package_version_file(${PROJECT_BINARY_DIR}/imgfileConfigVersion.cmake
    COMPATIBILITY SameMinorVersion)
install(FILES ${PROJECT_BINARY_DIR}/imgfileConfigVersion.cmake DESTINATION ${package_dir})

cmake_path(RELATIVE_PATH CMAKE_INSTALL_PREFIX
    BASE_DIRECTORY ${CMAKE_INSTALL_FULL_LIBDIR}/pkgconfig
    OUTPUT_VARIABLE prefix_from_pc)
configure_file(${PROJECT_SOURCE_DIR}/cmake/imgfile.pc.in ${PROJECT_BINARY_DIR}/imgfile.pc @ONLY)
install(FILES ${PROJECT_BINARY_DIR}/imgfile.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)

install(FILES ${PROJECT_SOURCE_DIR}/LICENSE ${PROJECT_SOURCE_DIR}/README.md
    DESTINATION ${CMAKE_INSTALL_DOCDIR})
