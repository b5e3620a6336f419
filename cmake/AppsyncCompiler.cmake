# How every file of the project is compiled. Warnings are errors for all of them.

set(CMAKE_CXX_STANDARD 20)
set(CMAKE_CXX_STANDARD_REQUIRED ON)
set(CMAKE_CXX_EXTENSIONS OFF)
set(CMAKE_EXPORT_COMPILE_COMMANDS ON)

if(PROJECT_IS_TOP_LEVEL AND NOT CMAKE_BUILD_TYPE)
    set(CMAKE_BUILD_TYPE Release CACHE STRING "Build type" FORCE)
endif()
# -O3 makes the build longer and the command no faster: its time goes into the kernel and zlib.
set(CMAKE_CXX_FLAGS_RELEASE "-O2 -DNDEBUG")

add_compile_options(-Wall -Wextra -Wpedantic -Wconversion -Wshadow -Werror)
if(CMAKE_CXX_COMPILER_ID STREQUAL "Clang")
    add_compile_options(-Wthread-safety)
elseif(CMAKE_CXX_COMPILER_ID STREQUAL "GNU" AND CMAKE_CXX_COMPILER_VERSION VERSION_LESS 13)
    # GCC 12 warns of overlapping and overlong copies inside std::string's own operator+ (GCC bugs
    # 105329 and 105651). clang's builds look for what is out of bounds as well.
    add_compile_options(-Wno-restrict -Wno-array-bounds -Wno-stringop-overflow
                        $<$<CONFIG:Release>:-Wno-stringop-overread>)
endif()

if(NOT APPSYNC_SANITIZE STREQUAL "none")
    # Line tables are all that a sanitizer's stack trace needs.
    if(CMAKE_CXX_COMPILER_ID STREQUAL "Clang")
        set(CMAKE_CXX_FLAGS_DEBUG "-O1 -gline-tables-only -fno-omit-frame-pointer")
    else()
        set(CMAKE_CXX_FLAGS_DEBUG "-O1 -g1 -fno-omit-frame-pointer")
    endif()
    # For code that is large and runs little.
    set(APPSYNC_UNOPTIMIZED -O0)
endif()
if(APPSYNC_SANITIZE STREQUAL "address")
    add_compile_options(-fsanitize=address,undefined -fno-sanitize-recover=all)
    add_link_options(-fsanitize=address,undefined)
elseif(APPSYNC_SANITIZE STREQUAL "thread")
    add_compile_options(-fsanitize=thread)
    if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
        # Instrumented code confuses these two warnings; the other builds have them.
        add_compile_options(-Wno-maybe-uninitialized -Wno-tsan)
    endif()
    add_link_options(-fsanitize=thread)
elseif(NOT APPSYNC_SANITIZE STREQUAL "none")
    message(FATAL_ERROR "APPSYNC_SANITIZE is '${APPSYNC_SANITIZE}'; use none, address or thread")
endif()

if(APPSYNC_FUZZ)
    if(NOT CMAKE_CXX_COMPILER_ID STREQUAL "Clang" OR NOT APPSYNC_SANITIZE STREQUAL "address")
        message(FATAL_ERROR "APPSYNC_FUZZ needs clang, which brings libFuzzer, and AddressSanitizer; use the preset 'fuzz'")
    endif()
endif()

if(APPSYNC_COVERAGE)
    if(NOT CMAKE_CXX_COMPILER_ID STREQUAL "Clang")
        message(FATAL_ERROR "APPSYNC_COVERAGE counts as clang does; use the preset 'coverage'")
    endif()
    set(CMAKE_CXX_FLAGS_DEBUG "-O1")
    add_compile_options(-fprofile-instr-generate -fcoverage-mapping)
    add_link_options(-fprofile-instr-generate)
endif()

find_program(APPSYNC_CCACHE ccache)
if(APPSYNC_CCACHE AND NOT CMAKE_CXX_COMPILER_LAUNCHER)
    set(CMAKE_CXX_COMPILER_LAUNCHER
        "${CMAKE_COMMAND}" -E env "CCACHE_BASEDIR=${PROJECT_SOURCE_DIR}" CCACHE_NOHASHDIR=1
        CCACHE_SLOPPINESS=pch_defines,time_macros "${APPSYNC_CCACHE}")
    if(CMAKE_CXX_COMPILER_ID STREQUAL "Clang")
        # A time stamp inside a precompiled header would make each one new to ccache.
        add_compile_options("SHELL:-Xclang -fno-pch-timestamp")
    endif()
endif()

find_program(APPSYNC_LLD ld.lld)
if(APPSYNC_LLD)
    add_link_options(-fuse-ld=lld)
endif()
