# Toolchain file: 32-bit x86 (i386) build on a Debian amd64 machine, with the
# host's gcc/g++ in -m32 mode (g++-multilib) and the Debian multiarch :i386
# -dev packages (libjsoncpp-dev:i386, libunistring-dev:i386,
# libgtest-dev:i386, libgmock-dev:i386, libsqlite3-dev:i386 or, failing that,
# libsqlite3-0:i386; libcli11-dev is architecture-independent).
#
#   cmake -S . -B build-i386 -DCMAKE_TOOLCHAIN_FILE=cmake/i386.cmake -DVELLIS_BUILD_BENCH=OFF
#
# The benchmarks stay off: there is no libbenchmark-dev:i386 in this set.

set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR i686)
# An amd64 kernel runs i386 binaries natively: the tests, gtest_discover_tests
# and try_run() run the built programs as they are.
set(CMAKE_CROSSCOMPILING FALSE)

set(CMAKE_C_COMPILER gcc)
set(CMAKE_CXX_COMPILER g++)
set(CMAKE_C_FLAGS_INIT "-m32")
set(CMAKE_CXX_FLAGS_INIT "-m32")
set(CMAKE_EXE_LINKER_FLAGS_INIT "-m32")
set(CMAKE_SHARED_LINKER_FLAGS_INIT "-m32")
set(CMAKE_MODULE_LINKER_FLAGS_INIT "-m32")

# Debian's multiarch triplet: find_library() looks in /usr/lib/i386-linux-gnu
# and find_package() in /usr/lib/i386-linux-gnu/cmake/<name>.
set(CMAKE_LIBRARY_ARCHITECTURE i386-linux-gnu)
set(CMAKE_SYSTEM_LIBRARY_PATH /usr/lib/i386-linux-gnu /lib/i386-linux-gnu /usr/lib32 /lib32)
set(CMAKE_PREFIX_PATH /usr/lib/i386-linux-gnu/cmake)
# Never pick up the amd64 twin of a library.
set(CMAKE_IGNORE_PATH
    /usr/lib/x86_64-linux-gnu /lib/x86_64-linux-gnu /usr/lib64 /lib64
    /usr/lib/x86_64-linux-gnu/cmake)

# pkg-config: the i386 .pc files (plus the architecture-independent ones) only.
set(ENV{PKG_CONFIG_LIBDIR} "/usr/lib/i386-linux-gnu/pkgconfig:/usr/share/pkgconfig")
set(ENV{PKG_CONFIG_PATH} "")

# libsqlite3-dev:i386 brings the libsqlite3.so link; where only the runtime
# libsqlite3-0:i386 is installed (its header is the same file as the amd64
# package's), link the runtime library itself.
if(NOT DEFINED SQLite3_LIBRARY
   AND NOT EXISTS /usr/lib/i386-linux-gnu/libsqlite3.so
   AND EXISTS /usr/lib/i386-linux-gnu/libsqlite3.so.0)
  set(SQLite3_LIBRARY /usr/lib/i386-linux-gnu/libsqlite3.so.0 CACHE FILEPATH
      "SQLite library (i386 runtime library: no libsqlite3-dev:i386)")
endif()
