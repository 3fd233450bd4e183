# Options every target of this project builds with, carried by one interface
# target that each target links privately (nothing is set globally).
add_library(ulo_db_build_options INTERFACE)
target_compile_features(ulo_db_build_options INTERFACE cxx_std_17)
# -g in every configuration: Release code is the same with it, and the
# Debian packaging strips it into the -dbgsym package.
target_compile_options(ulo_db_build_options INTERFACE -Wall -Wextra -Werror=format -g)

if(ULO_DB_SANITIZER STREQUAL "address")
    set(_ulo_sanitize -fsanitize=address,undefined -fno-sanitize-recover=all -fno-omit-frame-pointer)
elseif(ULO_DB_SANITIZER STREQUAL "thread")
    set(_ulo_sanitize -fsanitize=thread -fno-omit-frame-pointer)
elseif(NOT ULO_DB_SANITIZER STREQUAL "")
    message(FATAL_ERROR "ULO_DB_SANITIZER must be '', 'address' or 'thread', not '${ULO_DB_SANITIZER}'")
endif()
if(_ulo_sanitize)
    target_compile_options(ulo_db_build_options INTERFACE ${_ulo_sanitize})
    target_link_options(ulo_db_build_options INTERFACE ${_ulo_sanitize})
endif()

# Writes a pkg-config file NAME.pc for an installed library. The prefix is
# found relative to the .pc file, so the package works wherever
# `cmake --install --prefix` puts it.
function(ulo_db_install_pkgconfig name description requires cflags libs)
    file(RELATIVE_PATH PC_RELATIVE_PREFIX "/root/${CMAKE_INSTALL_LIBDIR}/pkgconfig" "/root")
    set(PC_NAME "${name}")
    set(PC_DESCRIPTION "${description}")
    set(PC_REQUIRES "${requires}")
    set(PC_CFLAGS "${cflags}")
    set(PC_LIBS "${libs}")
    configure_file("${PROJECT_SOURCE_DIR}/cmake/pkgconfig.pc.in" "${PROJECT_BINARY_DIR}/pkgconfig/${name}.pc" @ONLY)
    install(FILES "${PROJECT_BINARY_DIR}/pkgconfig/${name}.pc" DESTINATION "${CMAKE_INSTALL_LIBDIR}/pkgconfig"
            COMPONENT dev)
endfunction()

# ulo_db_optional_part(OPTION WHAT PACKAGES FOUND): decides whether an optional
# part is built. OPTION is AUTO (build it when FOUND), ON (build it; missing
# packages are an error) or OFF. When the packages are missing, one sentence
# names them: a status line for AUTO, the error for ON. Sets OPTION_ENABLED.
function(ulo_db_optional_part option what packages found)
    set(enabled FALSE)
    set(sentence "${what} not built: install the Debian package(s) ${packages}, then configure again")
    if("${${option}}" STREQUAL "AUTO")
        if(found)
            set(enabled TRUE)
        else()
            message(STATUS "${sentence}")
        endif()
    elseif(${option})
        if(NOT found)
            message(FATAL_ERROR "${sentence}")
        endif()
        set(enabled TRUE)
    endif()
    set(${option}_ENABLED ${enabled} PARENT_SCOPE)
endfunction()
