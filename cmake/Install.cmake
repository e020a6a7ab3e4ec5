include(CMakePackageConfigHelpers)

# Installs targets as the CMake package of that name, under which they have the namespace of the package.
function(brenix_install_package package)
    set(folder ${CMAKE_INSTALL_LIBDIR}/cmake/${package})
    install(TARGETS ${ARGN} EXPORT ${package} DESTINATION ${CMAKE_INSTALL_LIBDIR})
    install(EXPORT ${package} NAMESPACE ${package}:: DESTINATION ${folder})
    configure_package_config_file(${PROJECT_SOURCE_DIR}/cmake/${package}Config.cmake.in
        ${PROJECT_BINARY_DIR}/${package}Config.cmake INSTALL_DESTINATION ${folder})
    write_basic_package_version_file(${PROJECT_BINARY_DIR}/${package}ConfigVersion.cmake
        COMPATIBILITY SameMajorVersion)
    install(FILES ${PROJECT_BINARY_DIR}/${package}Config.cmake
        ${PROJECT_BINARY_DIR}/${package}ConfigVersion.cmake DESTINATION ${folder})
endfunction()
