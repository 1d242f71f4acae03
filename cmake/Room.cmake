# A room is one folder of the architecture: a library of its sources, a test program of its *_test.cpp, and
# an include directory that shows its own headers only. A room sees the headers of the rooms it links, so an
# include against the architecture does not compile.
#
#   typhon_room(NAME FOLDER [LINKS library...] [TEST_LINKS library...])
#
# FOLDER is the folder's path in the repository, which is also the prefix of its includes.
function(typhon_room name folder)
    cmake_parse_arguments(ROOM "" "" "LINKS;TEST_LINKS;EXCLUDE" ${ARGN})
    file(GLOB headers CONFIGURE_DEPENDS ${CMAKE_CURRENT_SOURCE_DIR}/*.h)
    file(GLOB sources CONFIGURE_DEPENDS ${CMAKE_CURRENT_SOURCE_DIR}/*.cpp)
    set(tests ${sources})
    list(FILTER tests INCLUDE REGEX "_test\\.cpp$")
    list(FILTER sources EXCLUDE REGEX "(_test|/main)\\.cpp$")
    foreach(pattern ${ROOM_EXCLUDE})
        list(FILTER sources EXCLUDE REGEX ${pattern})
        list(FILTER tests EXCLUDE REGEX ${pattern})
    endforeach()

    set(shown ${CMAKE_BINARY_DIR}/rooms/${name})
    file(REMOVE_RECURSE ${shown})
    file(MAKE_DIRECTORY ${shown}/${folder})
    foreach(header ${headers})
        get_filename_component(header_name ${header} NAME)
        file(CREATE_LINK ${header} ${shown}/${folder}/${header_name} SYMBOLIC)
    endforeach()

    if(sources)
        add_library(typhon_${name} STATIC ${sources})
        target_include_directories(typhon_${name} PUBLIC ${shown})
        target_link_libraries(typhon_${name} PUBLIC ${ROOM_LINKS})
    else()
        add_library(typhon_${name} INTERFACE)
        target_include_directories(typhon_${name} INTERFACE ${shown})
        target_link_libraries(typhon_${name} INTERFACE ${ROOM_LINKS})
    endif()

    if(tests AND BUILD_TESTING)
        typhon_tests(${name}_tests SOURCES ${tests} LINKS typhon_${name} ${ROOM_TEST_LINKS})
    endif()
endfunction()

#   typhon_tests(NAME SOURCES file... LINKS library... [LABELS label...])
function(typhon_tests name)
    cmake_parse_arguments(TESTS "" "" "SOURCES;LINKS;LABELS" ${ARGN})
    add_executable(${name} ${TESTS_SOURCES})
    target_link_libraries(${name} PRIVATE ${TESTS_LINKS} GTest::gmock GTest::gtest_main)
    if(TYPHON_SANITIZE)
        # Optimising what the macros of the tests expand to, instrumented, doubles the time of the whole build.
        set(files ${TESTS_SOURCES})
        list(FILTER files INCLUDE REGEX "_test\\.cpp$")
        set_source_files_properties(${files} PROPERTIES COMPILE_OPTIONS -O0)
    endif()
    if(NOT TESTS_LABELS)
        set(TESTS_LABELS unit)
    endif()
    gtest_discover_tests(${name} DISCOVERY_MODE PRE_TEST PROPERTIES TIMEOUT 120 LABELS "${TESTS_LABELS}")
endfunction()
