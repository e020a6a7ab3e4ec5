# A Debian package: cpack --config build/release/CPackConfig.cmake
#
# One package with everything. Whoever runs a generated program has also compiled it, and the headers are
# small beside the libraries.
set(CPACK_GENERATOR DEB)
set(CPACK_PACKAGE_CONTACT "The brenixcoder developers <developers@brenixcoder.invalid>")
set(CPACK_STRIP_FILES ON)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_SECTION libdevel)
set(CPACK_DEBIAN_PACKAGE_DESCRIPTION
    "Two libraries with their headers, plug-ins for devices and converters,
a command-line program, guides for authors of code generators and of
plug-ins, example programs, and a template for plug-ins.")
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
# What the README's cc and pkg-config are.
set(CPACK_DEBIAN_PACKAGE_RECOMMENDS "gcc, libc6-dev, pkgconf")
set(CPACK_DEBIAN_PACKAGE_SUGGESTS "gnuplot-nox, libsndfile1-dev, bash-completion")
set(CPACK_DEBIAN_PACKAGE_CONTROL_EXTRA ${PROJECT_SOURCE_DIR}/cmake/debian/shlibs
    ${PROJECT_SOURCE_DIR}/cmake/debian/triggers)
include(CPack)
