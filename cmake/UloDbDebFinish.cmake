# Run by cpack after it has built the packages (CPACK_POST_BUILD_SCRIPTS),
# with CPACK_PACKAGE_FILES naming them. Finishes each the way Debian's own
# tools would, which CPack 3.25 cannot:
#   - "Multi-Arch: same": the packages of two architectures install side by
#     side (their shared files, headers and documentation, are identical);
#   - the ldconfig trigger (DEBIAN/triggers) in place of the postinst and
#     postrm that only call ldconfig, so that nothing is left registered
#     once the package is removed;
#   - the libraries stripped of their symbol tables as well (CPack keeps
#     .symtab in them; the -dbgsym package has everything);
#   - the -dbgsym package's documentation folder a link to its library's;
# then md5sums and Installed-Size are written again to match.
foreach(deb IN LISTS CPACK_PACKAGE_FILES)
    set(dir "${deb}.d")
    file(REMOVE_RECURSE "${dir}")
    execute_process(COMMAND dpkg-deb -R "${deb}" "${dir}" COMMAND_ERROR_IS_FATAL ANY)
    file(READ "${dir}/DEBIAN/control" control)
    if(NOT control MATCHES "(^|\n)Architecture: all\n")
        string(REGEX REPLACE "(^|\n)(Architecture: [^\n]*\n)" "\\1\\2Multi-Arch: same\n" control "${control}")
    endif()
    # A -dbgsym package documents itself through its library's folder.
    if(control MATCHES "\nAuto-Built-Package: debug-symbols\n" AND control MATCHES "\nPackage: ([^\n]*)-dbgsym\n")
        file(MAKE_DIRECTORY "${dir}/usr/share/doc")
        file(CREATE_LINK "${CMAKE_MATCH_1}" "${dir}/usr/share/doc/${CMAKE_MATCH_1}-dbgsym" SYMBOLIC)
    endif()
    foreach(script postinst postrm)
        if(EXISTS "${dir}/DEBIAN/${script}")
            file(READ "${dir}/DEBIAN/${script}" text)
            string(REGEX REPLACE "#![^\n]*\n|set -e\n|if \\[[^\n]*\\]; then\n|[ \t]*ldconfig\n|fi\n|[ \t\n]" "" rest "${text}")
            if(NOT rest STREQUAL "")
                message(FATAL_ERROR "${deb}: ${script} does more than call ldconfig:\n${text}")
            endif()
            file(REMOVE "${dir}/DEBIAN/${script}")
            file(WRITE "${dir}/DEBIAN/triggers" "activate-noawait ldconfig\n")
        endif()
    endforeach()
    file(GLOB_RECURSE libraries "${dir}/usr/lib/*.so.*")
    foreach(library IN LISTS libraries)
        if(NOT IS_SYMLINK "${library}")
            execute_process(COMMAND "${CPACK_ULO_DB_STRIP}" --strip-unneeded --remove-section=.comment
                                    --remove-section=.note "${library}" COMMAND_ERROR_IS_FATAL ANY)
        endif()
    endforeach()
    # md5sums of every regular file, Installed-Size in KiB (each file
    # rounded up, as dpkg-gencontrol counts).
    file(GLOB_RECURSE files LIST_DIRECTORIES false RELATIVE "${dir}" "${dir}/*")
    set(md5sums "")
    set(kib 0)
    foreach(file IN LISTS files)
        if(file MATCHES "^DEBIAN/")
            continue()
        endif()
        math(EXPR kib "${kib} + 1")
        if(NOT IS_SYMLINK "${dir}/${file}")
            file(MD5 "${dir}/${file}" sum)
            string(APPEND md5sums "${sum}  ${file}\n")
            file(SIZE "${dir}/${file}" size)
            math(EXPR kib "${kib} + (${size} + 1023) / 1024 - 1")
        endif()
    endforeach()
    string(REGEX REPLACE "\nInstalled-Size: [0-9]+\n" "\nInstalled-Size: ${kib}\n" control "${control}")
    file(WRITE "${dir}/DEBIAN/control" "${control}")
    file(WRITE "${dir}/DEBIAN/md5sums" "${md5sums}")
    execute_process(COMMAND dpkg-deb --root-owner-group -Zxz -b "${dir}" "${deb}" OUTPUT_QUIET
                    COMMAND_ERROR_IS_FATAL ANY)
    file(REMOVE_RECURSE "${dir}")
endforeach()
