# Installation and packaging of the SDK: public headers, the two shared
# libraries with their CMake package and pkg-config files, the importer module
# and the host; `cpack -G DEB` turns the same tree into a Debian package.
include(CMakePackageConfigHelpers)

set(SCENE_INSTALL_CMAKEDIR ${CMAKE_INSTALL_LIBDIR}/cmake/scene_assimp)

# Installed programs find the libraries relative to themselves, wherever the
# prefix is.
file(RELATIVE_PATH _scene_bin_to_lib /${CMAKE_INSTALL_BINDIR} /${CMAKE_INSTALL_LIBDIR})
file(RELATIVE_PATH _scene_plugin_to_lib /${SCENE_INSTALL_PLUGINDIR} /${CMAKE_INSTALL_LIBDIR})
set_target_properties(scene-import PROPERTIES INSTALL_RPATH "$ORIGIN/${_scene_bin_to_lib}")
set_target_properties(scene_assimp PROPERTIES INSTALL_RPATH "$ORIGIN/${_scene_plugin_to_lib}")

install(TARGETS base1 scene EXPORT scene_assimpTargets
        LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT runtime NAMELINK_COMPONENT sdk
        INCLUDES DESTINATION ${SCENE_INSTALL_INCLUDEDIR})
install(TARGETS scene_assimp LIBRARY DESTINATION ${SCENE_INSTALL_PLUGINDIR} COMPONENT runtime)
install(TARGETS scene-import RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR} COMPONENT runtime)

# Public headers only: the sources' private headers and the module's (the
# only ones that see assimp) stay behind.
install(DIRECTORY ${PROJECT_SOURCE_DIR}/base/include/ ${PROJECT_SOURCE_DIR}/scene/include/
        DESTINATION ${SCENE_INSTALL_INCLUDEDIR} COMPONENT sdk
        FILES_MATCHING PATTERN "*.h" PATTERN "*.def")

install(EXPORT scene_assimpTargets NAMESPACE scene_assimp:: DESTINATION ${SCENE_INSTALL_CMAKEDIR}
        COMPONENT sdk)
configure_package_config_file(${CMAKE_CURRENT_LIST_DIR}/scene_assimpConfig.cmake.in
                              ${PROJECT_BINARY_DIR}/scene_assimpConfig.cmake
                              INSTALL_DESTINATION ${SCENE_INSTALL_CMAKEDIR}
                              PATH_VARS SCENE_INSTALL_PLUGINDIR)
write_basic_package_version_file(${PROJECT_BINARY_DIR}/scene_assimpConfigVersion.cmake
                                 COMPATIBILITY SameMajorVersion)
install(FILES ${PROJECT_BINARY_DIR}/scene_assimpConfig.cmake
              ${PROJECT_BINARY_DIR}/scene_assimpConfigVersion.cmake
        DESTINATION ${SCENE_INSTALL_CMAKEDIR} COMPONENT sdk)

# pkg-config: scene_assimp (the scene library, which brings base1) and
# scene_assimp-base1 alone.
set(SCENE_PC_SANITIZE "")
if(SCENE_SANITIZE)
    set(SCENE_PC_SANITIZE " -fsanitize=address,undefined")
endif()
# Relocatable: the prefix is found from the .pc file's own folder.
file(RELATIVE_PATH SCENE_PC_TO_PREFIX /${CMAKE_INSTALL_LIBDIR}/pkgconfig /)
string(REGEX REPLACE "/$" "" SCENE_PC_TO_PREFIX "${SCENE_PC_TO_PREFIX}")
foreach(_pc scene_assimp scene_assimp-base1)
    configure_file(${CMAKE_CURRENT_LIST_DIR}/${_pc}.pc.in ${PROJECT_BINARY_DIR}/${_pc}.pc @ONLY)
    install(FILES ${PROJECT_BINARY_DIR}/${_pc}.pc
            DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig COMPONENT sdk)
endforeach()

# Debian package of the whole install tree.
set(CPACK_PACKAGE_NAME scene-assimp)
set(CPACK_PACKAGE_VERSION ${PROJECT_VERSION})
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY
    "Scene import module for every format assimp reads, its SDK and the scene-import host")
set(CPACK_PACKAGE_CONTACT "scene_assimp developers <scene-assimp@localhost>")
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_SECTION libdevel)
# Debian 12's runtime libraries the libraries, module and host link.
string(CONCAT CPACK_DEBIAN_PACKAGE_DEPENDS
    "libassimp5 (>= 5.2.5), libpugixml1v5 (>= 1.13), libzip4 (>= 1.7), zlib1g, liblz4-1, "
    "liblzma5, libzstd1, libpng16-16, libstdc++6 (>= 12), libc6 (>= 2.36)")
set(CPACK_DEBIAN_COMPRESSION_TYPE gzip)
include(CPack)
