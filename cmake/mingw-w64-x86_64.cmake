# Cross build for 64-bit Windows with MinGW-w64. The -posix variants carry std::thread and
# std::mutex (GoogleTest needs them); executables and DLLs link the runtime statically so
# they import only system DLLs and run under Wine and on Windows without extra DLLs.
set(CMAKE_SYSTEM_NAME Windows)
set(CMAKE_SYSTEM_PROCESSOR x86_64)
set(CMAKE_C_COMPILER x86_64-w64-mingw32-gcc-posix)
set(CMAKE_CXX_COMPILER x86_64-w64-mingw32-g++-posix)
set(CMAKE_RC_COMPILER x86_64-w64-mingw32-windres)
set(CMAKE_FIND_ROOT_PATH /usr/x86_64-w64-mingw32)
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_PACKAGE ONLY)
set(CMAKE_EXE_LINKER_FLAGS_INIT "-static")
set(CMAKE_SHARED_LINKER_FLAGS_INIT "-static")
set(CMAKE_MODULE_LINKER_FLAGS_INIT "-static")

# Boost is header-only for us: a folder that holds only a link to the host's boost headers
# (the host's /usr/include would pull in glibc headers).
set(LB_CROSS_BOOST_DIR ${CMAKE_BINARY_DIR}/cross-boost)
if(NOT EXISTS ${LB_CROSS_BOOST_DIR}/boost)
  file(MAKE_DIRECTORY ${LB_CROSS_BOOST_DIR})
  file(CREATE_LINK /usr/include/boost ${LB_CROSS_BOOST_DIR}/boost SYMBOLIC)
endif()

# CTest runs the Windows executables through Wine (Debian installs the 64-bit loader as wine).
set(CMAKE_CROSSCOMPILING_EMULATOR wine)
