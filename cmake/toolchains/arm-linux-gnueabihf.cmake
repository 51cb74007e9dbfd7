# 32-bit ARM (hard float): Debian's cross compiler against its armhf multiarch
# libraries (scripts/install-deps --32); test programs run under qemu-arm.
set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR arm)
set(CMAKE_C_COMPILER arm-linux-gnueabihf-gcc)
set(CMAKE_CXX_COMPILER arm-linux-gnueabihf-g++)
set(CMAKE_LIBRARY_ARCHITECTURE arm-linux-gnueabihf)
# The loader must be the multiarch one, of the same build as the libc it loads:
# the cross compiler's own (under /usr/arm-linux-gnueabihf) may be older, and a
# mismatched pair crashes in pthread_create.
set(CMAKE_CROSSCOMPILING_EMULATOR qemu-arm -L /)

# As for i386: the lite runtime only, headers and protoc from the host.
set(_lite /usr/lib/arm-linux-gnueabihf/libprotobuf-lite.so.32)
set(Protobuf_LITE_LIBRARY ${_lite} CACHE FILEPATH "lite protobuf runtime")
set(Protobuf_LIBRARY ${_lite} CACHE FILEPATH "protobuf runtime (the lite one suffices)")

# No Java VM runs there: the JNI headers are the host JDK's (the same on every
# Linux architecture), and the in-process end-to-end tests run against a
# stand-in VM.
set(VOK_TEST_STUB_VM ON CACHE BOOL "In-process end-to-end tests under a stand-in Java VM")

# GCC's notes that the ABI of some arguments changed in GCC 7.1 concern code
# built by older compilers, none of which is linked here.
set(CMAKE_CXX_FLAGS_INIT -Wno-psabi)
