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

# What pkg-config needs to know. It follows the installation when that is moved.
function(brenix_install_pkgconfig package)
    set(folder ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
    file(RELATIVE_PATH up /${folder} /)
    configure_file(${PROJECT_SOURCE_DIR}/cmake/${package}.pc.in
        ${PROJECT_BINARY_DIR}/${package}.pc @ONLY)
    install(FILES ${PROJECT_BINARY_DIR}/${package}.pc DESTINATION ${folder})
endfunction()

# The documentation, laid out as in the repository, so that its links hold: those to headers by links to
# the installed ones.
function(brenix_install_docs)
    set(folder ${CMAKE_INSTALL_DOCDIR})
    install(FILES README.md CHANGELOG.md CONTRIBUTING.md SECURITY.md DESTINATION ${folder})
    install(DIRECTORY docs DESTINATION ${folder} FILES_MATCHING PATTERN *.md PATTERN *.svg
        PATTERN man EXCLUDE)
    install(DIRECTORY examples DESTINATION ${folder} FILES_MATCHING PATTERN *.c PATTERN *.h)
    install(DIRECTORY plugins/template DESTINATION ${folder}/plugins)
    install(FILES plugins/loopback.cpp plugins/signal.cpp plugins/ByteDevice.hpp plugins/Elements.hpp
        plugins/Losses.hpp plugins/Transfer.hpp plugins/Waits.hpp DESTINATION ${folder}/plugins)
    install(FILES docs/man/brenixcoder.3 DESTINATION ${CMAKE_INSTALL_MANDIR}/man3)
    foreach(headers include/brenixcoder include/brenixplugin core/include/brenixcore)
        cmake_path(GET headers PARENT_PATH parent)
        cmake_path(GET headers FILENAME name)
        file(RELATIVE_PATH target /${folder}/${parent} /${CMAKE_INSTALL_INCLUDEDIR}/${name})
        file(MAKE_DIRECTORY ${PROJECT_BINARY_DIR}/links/${parent})
        file(CREATE_LINK ${target} ${PROJECT_BINARY_DIR}/links/${headers} SYMBOLIC)
        install(FILES ${PROJECT_BINARY_DIR}/links/${headers} DESTINATION ${folder}/${parent})
    endforeach()
endfunction()
