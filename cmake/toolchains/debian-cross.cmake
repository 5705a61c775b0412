# Cross build for KORVO_CROSS_TRIPLET with Debian's cross compiler and the multiarch -dev
# packages (libraries in /usr/lib/<triplet>, headers in /usr/include); the tests run under
# KORVO_CROSS_EMULATOR (qemu-user), which finds the target's loader and libraries at their
# multiarch places. Included by the toolchain file of each target.
set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_C_COMPILER ${KORVO_CROSS_TRIPLET}-gcc)
set(CMAKE_CXX_COMPILER ${KORVO_CROSS_TRIPLET}-g++)
set(CMAKE_LIBRARY_ARCHITECTURE ${KORVO_CROSS_TRIPLET})
set(CMAKE_CROSSCOMPILING_EMULATOR ${KORVO_CROSS_EMULATOR})
# pkg-config reads only the target's .pc files (and the architecture-free ones).
set(ENV{PKG_CONFIG_LIBDIR} /usr/lib/${KORVO_CROSS_TRIPLET}/pkgconfig:/usr/share/pkgconfig)
set(ENV{PKG_CONFIG_PATH} "")
# Programs come from the build machine; libraries never from the build machine's own places.
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_IGNORE_PATH /usr/lib/x86_64-linux-gnu /lib/x86_64-linux-gnu)
