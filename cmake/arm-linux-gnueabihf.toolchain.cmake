# Another 32-bit processor, little-endian: ARM with a floating point unit (Debian's armhf).
set(target arm-linux-gnueabihf)
set(CMAKE_SYSTEM_PROCESSOR arm)
include(${CMAKE_CURRENT_LIST_DIR}/TargetSysroot.cmake)
