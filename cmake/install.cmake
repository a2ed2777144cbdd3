# The installed tree, in components (cmake --install BUILD --component NAME installs one of them):
#   library       the shared library
#   development   header, CMake package, pkg-config file, example, manual pages of section 3
#   tool          the program, its completion, manual pages of sections 1 and 5
#   gdal          the GDAL plugin (gdal/CMakeLists.txt) and its example
#   licence       LICENSE, which Debian packages replace by their own file
# The CMake package and the pkg-config file name the same include folder, so that hosts write
# #include <img.h>. Both still work after the tree is moved.
include(CMakePackageConfigHelpers)
include(GNUInstallDirs)

set(package_dir ${CMAKE_INSTALL_LIBDIR}/cmake/imgfile)
install(TARGETS imgfile
    EXPORT imgfile_targets
    LIBRARY COMPONENT library NAMELINK_COMPONENT development
    FILE_SET HEADERS DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/imgfile COMPONENT development)
install(EXPORT imgfile_targets
    FILE imgfileConfig.cmake  # the targets are the whole package: no dependencies
    NAMESPACE imgfile::
    DESTINATION ${package_dir}
    COMPONENT development)
write_basic_package_version_file(${PROJECT_BINARY_DIR}/imgfileConfigVersion.cmake
    COMPATIBILITY SameMinorVersion)
install(FILES ${PROJECT_BINARY_DIR}/imgfileConfigVersion.cmake
    DESTINATION ${package_dir} COMPONENT development)

cmake_path(RELATIVE_PATH CMAKE_INSTALL_PREFIX
    BASE_DIRECTORY ${CMAKE_INSTALL_FULL_LIBDIR}/pkgconfig
    OUTPUT_VARIABLE prefix_from_pc)
configure_file(${PROJECT_SOURCE_DIR}/cmake/imgfile.pc.in ${PROJECT_BINARY_DIR}/imgfile.pc @ONLY)
install(FILES ${PROJECT_BINARY_DIR}/imgfile.pc
    DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig COMPONENT development)

# A page describes all functions in its section NAME, and man finds it by each of these names.
file(GLOB pages CONFIGURE_DEPENDS ${PROJECT_SOURCE_DIR}/docs/man/*.3)
install(FILES ${pages} DESTINATION ${CMAKE_INSTALL_MANDIR}/man3 COMPONENT development)
set_property(DIRECTORY APPEND PROPERTY CMAKE_CONFIGURE_DEPENDS ${pages})
foreach(page ${pages})
    cmake_path(GET page STEM described)
    file(STRINGS ${page} names REGEX "^\\.Nm img_")
    list(TRANSFORM names REPLACE "^\\.Nm (img_[a-z_]+).*" "\\1")
    list(REMOVE_ITEM names ${described})
    foreach(name ${names})
        file(WRITE ${PROJECT_BINARY_DIR}/man/${name}.3 ".so man3/${described}.3\n")
        install(FILES ${PROJECT_BINARY_DIR}/man/${name}.3
            DESTINATION ${CMAKE_INSTALL_MANDIR}/man3 COMPONENT development)
    endforeach()
endforeach()

install(FILES ${PROJECT_SOURCE_DIR}/LICENSE
    DESTINATION ${CMAKE_INSTALL_DOCDIR} COMPONENT licence)
install(FILES ${PROJECT_SOURCE_DIR}/README.md
    DESTINATION ${CMAKE_INSTALL_DOCDIR} COMPONENT development)
install(FILES ${PROJECT_SOURCE_DIR}/examples/smallest_host.c
    DESTINATION ${CMAKE_INSTALL_DOCDIR}/examples COMPONENT development)
if(IMGFILE_BUILD_GDAL)
    install(FILES ${PROJECT_SOURCE_DIR}/examples/archive_statistics.py
        DESTINATION ${CMAKE_INSTALL_DOCDIR}/examples COMPONENT gdal)
endif()

if(TARGET imgfile_tool)
    set(tool_dir ${PROJECT_SOURCE_DIR}/tools/imgfile)
    install(TARGETS imgfile_tool RUNTIME COMPONENT tool)
    file(GLOB pages CONFIGURE_DEPENDS ${tool_dir}/man/*.1)
    install(FILES ${pages} DESTINATION ${CMAKE_INSTALL_MANDIR}/man1 COMPONENT tool)
    file(GLOB pages CONFIGURE_DEPENDS ${PROJECT_SOURCE_DIR}/docs/man/*.5)
    install(FILES ${pages} DESTINATION ${CMAKE_INSTALL_MANDIR}/man5 COMPONENT tool)
    if(EXISTS ${tool_dir}/completion.bash)
        install(FILES ${tool_dir}/completion.bash
            DESTINATION ${CMAKE_INSTALL_DATADIR}/bash-completion/completions
            RENAME imgfile
            COMPONENT tool)
    endif()
endif()
