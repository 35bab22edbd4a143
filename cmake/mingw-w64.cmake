# Cross-build for 64-bit Windows with mingw-w64 from a Linux machine:
#
#   cmake -S . -B build/windows -DCLIENT3_NATIVE_ONLY=ON -DCMAKE_TOOLCHAIN_FILE=cmake/mingw-w64.cmake
#   cmake --build build/windows --target client3-host
#
# The posix flavour of the compiler is the one whose standard library has std::thread.
set(CMAKE_SYSTEM_NAME Windows)
set(CMAKE_SYSTEM_PROCESSOR x86_64)

set(CLIENT3_MINGW_PREFIX x86_64-w64-mingw32 CACHE STRING "Target triplet of the mingw-w64 tools")
find_program(CMAKE_CXX_COMPILER NAMES ${CLIENT3_MINGW_PREFIX}-g++-posix ${CLIENT3_MINGW_PREFIX}-g++ REQUIRED)
find_program(CMAKE_C_COMPILER NAMES ${CLIENT3_MINGW_PREFIX}-gcc-posix ${CLIENT3_MINGW_PREFIX}-gcc)
find_program(CMAKE_RC_COMPILER NAMES ${CLIENT3_MINGW_PREFIX}-windres)

set(CMAKE_FIND_ROOT_PATH /usr/${CLIENT3_MINGW_PREFIX})
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_PACKAGE ONLY)

# The runtime libraries of the compiler go into the executable, so that it runs without DLLs beside it.
set(CMAKE_EXE_LINKER_FLAGS_INIT "-static -static-libgcc -static-libstdc++")
