# Debian packages, `cpack -G DEB` in a build folder (CPackConfig.cmake):
#   libulo-db1     the three libraries with their SONAME links (component runtime)
#   libulo-db-dev  headers, the .so links, the .pc files and the CMake package (component dev)
# The architecture is the build's: amd64 from a host build, armhf from the
# cross build (its toolchain file sets CPACK_DEBIAN_PACKAGE_ARCHITECTURE).
set(CPACK_PACKAGE_NAME ulo-db)
set(CPACK_PACKAGE_VENDOR "libulo_db")
# Each package's description starts with its own summary line (a package-wide
# summary would be put in front of both).
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "")
set(CPACK_PACKAGE_CONTACT "libulo_db maintainers <ulo-db@localhost>")
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_GENERATOR DEB)
set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_COMPONENTS_ALL runtime dev)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_SECTION libs)

set(CPACK_DEBIAN_RUNTIME_PACKAGE_NAME libulo-db${PROJECT_VERSION_MAJOR})
set(CPACK_DEBIAN_RUNTIME_PACKAGE_DEPENDS "libc6, libgcc-s1, libstdc++6, libsqlite3-0")
# A shlibs file, and ldconfig after install and removal, as in Debian's library packages.
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS ON)
set(CPACK_COMPONENT_RUNTIME_DESCRIPTION "${PROJECT_DESCRIPTION}: shared libraries
libulo_db.so with its platform stand-ins libulo_util.so and libdlog.so.")

set(CPACK_DEBIAN_DEV_PACKAGE_NAME libulo-db-dev)
set(CPACK_DEBIAN_DEV_PACKAGE_SECTION libdevel)
set(CPACK_DEBIAN_DEV_PACKAGE_DEPENDS
    "${CPACK_DEBIAN_RUNTIME_PACKAGE_NAME} (= ${PROJECT_VERSION}), libsqlite3-dev")
set(CPACK_COMPONENT_DEV_DESCRIPTION "${PROJECT_DESCRIPTION}: development files
Headers, pkg-config files (ulo_db, ulo_util, dlog) and the CMake package
(find_package(ulo_db), target ulo_db::ulo_db).")

include(CPack)
