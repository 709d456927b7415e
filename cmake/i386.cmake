# 32-bit x86 programs, built and run on 64-bit Debian: the compiler's own 32-bit runtime, with SQLite
# and JsonCpp from the sysroot that scripts/setup-i386.sh unpacks.
set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR i686)
set(CMAKE_LIBRARY_ARCHITECTURE i386-linux-gnu)
set(CMAKE_C_FLAGS_INIT -m32)
set(CMAKE_CXX_FLAGS_INIT -m32)

# Headers and libraries come from the sysroot alone; packages of headers only may be the host's.
get_filename_component(sysroot "${CMAKE_CURRENT_LIST_DIR}/../build/i386-sysroot" ABSOLUTE)
set(KELODR_I386_SYSROOT "${sysroot}" CACHE PATH "SQLite and JsonCpp for i386")
list(APPEND CMAKE_TRY_COMPILE_PLATFORM_VARIABLES KELODR_I386_SYSROOT)
set(CMAKE_FIND_ROOT_PATH "${KELODR_I386_SYSROOT}")
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)

# The loader looks in the sysroot too, also for what the library itself needs (hence the old tag),
# but not that of a system on which a package is installed.
if(CMAKE_SKIP_INSTALL_RPATH)
  set(search -rpath-link)
else()
  set(search -rpath)
endif()
set(libraries ${KELODR_I386_SYSROOT}/usr/lib/i386-linux-gnu)
set(CMAKE_EXE_LINKER_FLAGS_INIT
  "-L\"${libraries}\" -Wl,--disable-new-dtags,${search},\"${libraries}\"")
