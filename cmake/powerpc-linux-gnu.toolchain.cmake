# The appliance's processor: 32-bit PowerPC, big-endian. scripts/static-libraries makes the
# tree with the libraries for it; the compiler and its C library are Debian's.
set(target powerpc-linux-gnu)
set(CMAKE_SYSTEM_PROCESSOR ppc)
include(${CMAKE_CURRENT_LIST_DIR}/TargetSysroot.cmake)
