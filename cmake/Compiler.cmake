set(CMAKE_CXX_STANDARD 20)
set(CMAKE_CXX_STANDARD_REQUIRED ON)
set(CMAKE_CXX_EXTENSIONS OFF)
set(CMAKE_EXPORT_COMPILE_COMMANDS ON)
set(CMAKE_POSITION_INDEPENDENT_CODE ON)

set(TYPHON_SANITIZE "" CACHE STRING "Sanitizers to build with, as for -fsanitize=")
option(TYPHON_FUZZ "Build the fuzzers (needs clang)" OFF)
option(TYPHON_BENCH "Build the benchmarks" OFF)

add_compile_options(-Wall -Wextra -Wpedantic -Wshadow -Wconversion -Wnon-virtual-dtor -Woverloaded-virtual -Werror)
add_compile_definitions(_GNU_SOURCE)
if(TYPHON_SANITIZE)
    add_compile_options(-fsanitize=${TYPHON_SANITIZE} -fno-omit-frame-pointer -fno-sanitize-recover=all)
    add_link_options(-fsanitize=${TYPHON_SANITIZE})
    if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
        # Instrumentation hides from it that an optional's value is read only when there is one.
        add_compile_options(-Wno-maybe-uninitialized)
    endif()
    if(TYPHON_SANITIZE MATCHES "undefined")
        # Needs descriptors of its own, and so accuses tests in which none are left.
        add_compile_options(-fno-sanitize=vptr)
    endif()
    if(CMAKE_CXX_COMPILER_ID STREQUAL "Clang" AND TYPHON_SANITIZE MATCHES "undefined")
        # Clang 14 cannot assemble coroutines with it ("difference across sections").
        add_compile_options(-fno-sanitize=function)
    endif()
endif()

find_program(CCACHE ccache)
if(CCACHE)
    set(CMAKE_CXX_COMPILER_LAUNCHER ${CCACHE})
endif()
