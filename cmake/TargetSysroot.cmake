# What the toolchain files have in common. Set before: target, CMAKE_SYSTEM_PROCESSOR.
set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_C_COMPILER ${target}-gcc)
set(CMAKE_CXX_COMPILER ${target}-g++)
set(CMAKE_LIBRARY_ARCHITECTURE ${target})

if(NOT MARUBACKUP_SYSROOT)
    include(${CMAKE_CURRENT_LIST_DIR}/Sysroot.cmake)
    marubackup_sysroot(MARUBACKUP_SYSROOT ${target})
endif()
list(APPEND CMAKE_TRY_COMPILE_PLATFORM_VARIABLES MARUBACKUP_SYSROOT)

# Without a sysroot of its own the compiler goes on to the host's headers. The linker
# needs none: it would look there, too, for the libraries that ours need.
set(CMAKE_SYSROOT_COMPILE ${MARUBACKUP_SYSROOT})
set(CMAKE_FIND_ROOT_PATH ${MARUBACKUP_SYSROOT})
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_PACKAGE ONLY)
set(ENV{PKG_CONFIG_LIBDIR} ${MARUBACKUP_SYSROOT}/lib/pkgconfig:${MARUBACKUP_SYSROOT}/share/pkgconfig)
