# Cross-compiles for 32-bit big-endian PowerPC with Debian's g++-powerpc-linux-gnu; what is built
# runs under qemu-user. tests/powerpc/libraries.sh makes what it needs besides the compiler.

set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR ppc)

if(NOT DEFINED MAVOEA_POWERPC_LIBRARIES)
  get_filename_component(MAVOEA_POWERPC_LIBRARIES
                         "${CMAKE_CURRENT_LIST_DIR}/../build/powerpc-libraries" ABSOLUTE)
endif()
list(APPEND CMAKE_TRY_COMPILE_PLATFORM_VARIABLES MAVOEA_POWERPC_LIBRARIES)

set(CMAKE_C_COMPILER powerpc-linux-gnu-gcc)
set(CMAKE_CXX_COMPILER powerpc-linux-gnu-g++)
# Not qemu's -L, with which "/" is another directory for what runs in it.
set(CMAKE_CROSSCOMPILING_EMULATOR qemu-ppc /usr/powerpc-linux-gnu/lib/ld.so.1
                                  --library-path /usr/powerpc-linux-gnu/lib)

set(CMAKE_FIND_ROOT_PATH ${MAVOEA_POWERPC_LIBRARIES} /usr/powerpc-linux-gnu)
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_PACKAGE ONLY)
