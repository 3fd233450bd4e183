# Debian packages, `cpack -G DEB` in a build folder (CPackConfig.cmake):
#   libulo-db1         the three libraries with their SONAME links, stripped (component runtime)
#   libulo-db1-dbgsym  their debug information under /usr/lib/debug/.build-id (a .ddeb)
#   libulo-db-dev      headers, the .so links, the .pc files and the CMake package (component dev)
# The architecture is the build's: amd64 from a host build, armhf from the
# cross build (its toolchain file sets CPACK_DEBIAN_PACKAGE_ARCHITECTURE).
# Every package is Multi-Arch: same, so amd64 and armhf install side by side.
set(CPACK_PACKAGE_NAME ulo-db)
set(CPACK_PACKAGE_VENDOR "libulo_db")
# Each package's description starts with its own summary line (a package-wide
# summary would be put in front of both).
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "")
set(CPACK_PACKAGE_CONTACT "libulo_db maintainers <ulo-db@example.org>")
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_GENERATOR DEB)
set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_COMPONENTS_ALL runtime dev)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_SECTION libs)

set(CPACK_DEBIAN_RUNTIME_PACKAGE_NAME libulo-db${PROJECT_VERSION_MAJOR})
# Depends from dpkg-shlibdeps, with the versions the libraries need; it finds
# the package's own libraries in the package (there is no run path under /usr).
set(CPACK_DEBIAN_RUNTIME_PACKAGE_SHLIBDEPS ON)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS_PRIVATE_DIRS "${CMAKE_INSTALL_LIBDIR}")
# A shlibs file, as in Debian's library packages.
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS ON)
# The debug information goes into libulo-db1-dbgsym (gdb finds it by the
# build id); the cross build's own binutils read and split ARM files.
set(CPACK_DEBIAN_RUNTIME_DEBUGINFO_PACKAGE ON)
if(CMAKE_OBJCOPY AND CMAKE_READELF)
    set(CPACK_OBJCOPY_EXECUTABLE "${CMAKE_OBJCOPY}")
    set(CPACK_READELF_EXECUTABLE "${CMAKE_READELF}")
endif()
set(CPACK_COMPONENT_RUNTIME_DESCRIPTION "${PROJECT_DESCRIPTION}: shared libraries
libulo_db.so with its platform stand-ins libulo_util.so and libdlog.so.")

set(CPACK_DEBIAN_DEV_PACKAGE_NAME libulo-db-dev)
set(CPACK_DEBIAN_DEV_PACKAGE_SECTION libdevel)
set(CPACK_DEBIAN_DEV_PACKAGE_DEPENDS
    "${CPACK_DEBIAN_RUNTIME_PACKAGE_NAME} (= ${PROJECT_VERSION}), libsqlite3-dev (>= ${SQLite3_VERSION})")
set(CPACK_COMPONENT_DEV_DESCRIPTION "${PROJECT_DESCRIPTION}: development files
Headers, pkg-config files (ulo_db, ulo_util, dlog) and the CMake package
(find_package(ulo_db), target ulo_db::ulo_db).")

# What CPack cannot write itself, done to every package after it is built
# (see the script): Multi-Arch: same, the ldconfig trigger in place of
# maintainer scripts, libraries stripped of their symbol tables.
set(CPACK_POST_BUILD_SCRIPTS "${CMAKE_CURRENT_LIST_DIR}/UloDbDebFinish.cmake")
set(CPACK_ULO_DB_STRIP "${CMAKE_STRIP}")

# copyright (machine-readable, its license text taken from LICENSE) and the
# changelog in each package's documentation folder. Only packages get them:
# a plain `cmake --install` leaves them out.
file(READ "${PROJECT_SOURCE_DIR}/LICENSE" _ulo_license)
string(REGEX MATCH "Licensed under the Apache License[^\n]*\n.*limitations under the License\\." ULO_DB_LICENSE_GRANT
             "${_ulo_license}")
string(REGEX REPLACE "\n *" "\n " ULO_DB_LICENSE_GRANT " ${ULO_DB_LICENSE_GRANT}")
string(REGEX REPLACE "\n \n" "\n .\n" ULO_DB_LICENSE_GRANT "${ULO_DB_LICENSE_GRANT}")
configure_file("${CMAKE_CURRENT_LIST_DIR}/debian/copyright.in" "${PROJECT_BINARY_DIR}/debian/copyright" @ONLY)
# gzip -9n: no name or time stamp, so both architectures ship the same bytes.
execute_process(COMMAND gzip -9n -c "${CMAKE_CURRENT_LIST_DIR}/debian/changelog"
                OUTPUT_FILE "${PROJECT_BINARY_DIR}/debian/changelog.gz" COMMAND_ERROR_IS_FATAL ANY)
foreach(_ulo_component runtime dev)
    string(TOUPPER "${_ulo_component}" _ulo_upper)
    install(FILES "${PROJECT_BINARY_DIR}/debian/copyright" "${PROJECT_BINARY_DIR}/debian/changelog.gz"
            DESTINATION "${CMAKE_INSTALL_DATAROOTDIR}/doc/${CPACK_DEBIAN_${_ulo_upper}_PACKAGE_NAME}"
            COMPONENT ${_ulo_component} EXCLUDE_FROM_ALL)
endforeach()

# Installed under a prefix /usr (the system's, or a staging copy of it as
# CPack makes) the libraries are where the dynamic loader looks, and carry no
# run path, as Debian's policy asks of system libraries; under any other
# prefix they keep $ORIGIN and find each other next to themselves.
foreach(_ulo_target ulo_db ulo_util dlog)
    install(CODE "
        set(_ulo_file \"\$ENV{DESTDIR}\${CMAKE_INSTALL_PREFIX}/${CMAKE_INSTALL_LIBDIR}/$<TARGET_FILE_NAME:${_ulo_target}>\")
        if(CMAKE_INSTALL_PREFIX MATCHES \"(^|/)usr/?$\" AND EXISTS \"\${_ulo_file}\")
            file(RPATH_REMOVE FILE \"\${_ulo_file}\")
        endif()" COMPONENT runtime)
endforeach()

include(CPack)
