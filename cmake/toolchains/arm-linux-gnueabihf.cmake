# Cross build for the device: 32-bit ARM (hard float) Linux with Debian's
# arm-linux-gnueabihf toolchain, tests run under qemu-arm.
#
#   cmake -S . -B build-arm -DCMAKE_TOOLCHAIN_FILE=cmake/toolchains/arm-linux-gnueabihf.cmake \
#         -DULO_DB_ARM_SQLITE_ROOT=<folder holding the unpacked libsqlite3 armhf packages>
#
# ULO_DB_ARM_SQLITE_ROOT is a folder into which libsqlite3-0:armhf and
# libsqlite3-dev:armhf were unpacked with `dpkg -x` (scripts/test-arm.sh does
# this); FindSQLite3 is pointed at it. Nothing is installed into the system.

set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR arm)

set(ULO_DB_ARM_TRIPLET arm-linux-gnueabihf)
set(CMAKE_C_COMPILER ${ULO_DB_ARM_TRIPLET}-gcc)
set(CMAKE_CXX_COMPILER ${ULO_DB_ARM_TRIPLET}-g++)

# The cross compiler's own libraries (libc, libstdc++ ...) live here.
set(ULO_DB_ARM_LIBC_ROOT /usr/${ULO_DB_ARM_TRIPLET})

# Look for target headers and libraries only in the target's folders, for
# programs only on the host.
set(CMAKE_FIND_ROOT_PATH ${ULO_DB_ARM_LIBC_ROOT})
if(ULO_DB_ARM_SQLITE_ROOT)
    list(APPEND CMAKE_FIND_ROOT_PATH ${ULO_DB_ARM_SQLITE_ROOT})
endif()
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_PACKAGE ONLY)

# try_compile projects read this file again without the cache: hand the
# variable on so they see the same setup.
list(APPEND CMAKE_TRY_COMPILE_PLATFORM_VARIABLES ULO_DB_ARM_SQLITE_ROOT)

# The cross toolchain's C library first: with the system's armhf C library
# installed as well (multiarch, as the package check does), the loader's
# cache would otherwise mix the two, and a mixed pair crashes.
set(_ulo_arm_ld_dirs "${ULO_DB_ARM_LIBC_ROOT}/lib")
if(ULO_DB_ARM_SQLITE_ROOT)
    set(_ulo_sqlite_libdir "${ULO_DB_ARM_SQLITE_ROOT}/usr/lib/${ULO_DB_ARM_TRIPLET}")
    set(SQLite3_INCLUDE_DIR "${ULO_DB_ARM_SQLITE_ROOT}/usr/include" CACHE PATH "armhf sqlite3.h")
    set(SQLite3_LIBRARY "${_ulo_sqlite_libdir}/libsqlite3.so" CACHE FILEPATH "armhf libsqlite3")
    list(APPEND _ulo_arm_ld_dirs "${_ulo_sqlite_libdir}")
endif()
# The build's own shared libraries are found through the build-tree RPATH;
# they are also listed here so that a program copied elsewhere in the tree
# (or built without RPATH) still runs.
if(CMAKE_BINARY_DIR)
    list(APPEND _ulo_arm_ld_dirs "${CMAKE_BINARY_DIR}/lib/DADatabase" "${CMAKE_BINARY_DIR}/platform")
endif()
list(JOIN _ulo_arm_ld_dirs ":" _ulo_arm_ld_path)

# Every target program (add_test, gtest_discover_tests) runs through qemu,
# with the ARM dynamic loader and libc from the cross toolchain's folder.
set(CMAKE_CROSSCOMPILING_EMULATOR qemu-arm -L ${ULO_DB_ARM_LIBC_ROOT} -E LD_LIBRARY_PATH=${_ulo_arm_ld_path})

# Debian packages made from this build (cpack -G DEB) are for the device.
set(CPACK_DEBIAN_PACKAGE_ARCHITECTURE armhf)
