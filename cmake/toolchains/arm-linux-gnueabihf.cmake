# armhf: 32-bit ARM (ARMv7 with hardware floating point), where long and pointers have 32 bits.
set(KORVO_CROSS_TRIPLET arm-linux-gnueabihf)
set(CMAKE_SYSTEM_PROCESSOR arm)
set(KORVO_CROSS_EMULATOR qemu-arm)
include(${CMAKE_CURRENT_LIST_DIR}/debian-cross.cmake)
