# 32-bit x86: Debian's i686 cross compiler against its i386 multiarch
# libraries (scripts/install-deps --32). The programs run where the host runs
# i386 programs, natively or through qemu-user registered with binfmt_misc,
# so no emulator is named here.
set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR i686)
set(CMAKE_C_COMPILER i686-linux-gnu-gcc)
set(CMAKE_CXX_COMPILER i686-linux-gnu-g++)
set(CMAKE_LIBRARY_ARCHITECTURE i386-linux-gnu)

# Only the lite runtime is linked, and only its i386 runtime package is
# installed (headers and protoc are the host's, of the same version); the
# search for the full library is satisfied with the same file.
set(_lite /usr/lib/i386-linux-gnu/libprotobuf-lite.so.32)
set(Protobuf_LITE_LIBRARY ${_lite} CACHE FILEPATH "lite protobuf runtime")
set(Protobuf_LIBRARY ${_lite} CACHE FILEPATH "protobuf runtime (the lite one suffices)")
