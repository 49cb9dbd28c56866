# linefold_library(NAME SOURCES... DEPENDS...): the static library of one folder, linked only to
# what that folder may use.
function(linefold_library name)
    cmake_parse_arguments(ARG "" "" "SOURCES;DEPENDS" ${ARGN})
    add_library(${name} STATIC ${ARG_SOURCES})
    target_include_directories(${name} PUBLIC ${CMAKE_SOURCE_DIR} ${CMAKE_BINARY_DIR}/generated)
    target_link_libraries(${name} PUBLIC ${ARG_DEPENDS})
endfunction()

# linefold_ship(TARGET): links the compiler's own libraries statically, as shipped programs do.
function(linefold_ship target)
    if(NOT LINEFOLD_SANITIZE)
        target_link_options(${target} PRIVATE -static-libstdc++ -static-libgcc)
    endif()
endfunction()

# linefold_module(NAME SOURCES... LIBS...): lib<NAME>.so, which the daemon loads when it first needs the
# libraries that it stands on. It exports its own C functions, those that begin with "Linefold", and
# nothing else.
function(linefold_module)
    cmake_parse_arguments(ARG "" "NAME" "SOURCES;LIBS" ${ARGN})
    add_library(${ARG_NAME} MODULE ${ARG_SOURCES})
    target_include_directories(${ARG_NAME} PRIVATE ${CMAKE_SOURCE_DIR} ${CMAKE_BINARY_DIR}/generated)
    target_link_libraries(${ARG_NAME} PRIVATE ${ARG_LIBS})
    target_link_options(${ARG_NAME} PRIVATE
        -Wl,--exclude-libs,ALL -Wl,--version-script,${CMAKE_SOURCE_DIR}/cmake/module.map)
    set_target_properties(${ARG_NAME} PROPERTIES
        LIBRARY_OUTPUT_DIRECTORY ${CMAKE_BINARY_DIR}/bin/modules
        LINK_DEPENDS ${CMAKE_SOURCE_DIR}/cmake/module.map)
    linefold_ship(${ARG_NAME})
    install(TARGETS ${ARG_NAME} DESTINATION ${LINEFOLD_LIBRARY_DIR})
    add_dependencies(modules ${ARG_NAME})
endfunction()

# The whole core: the request table names the handlers, and the handlers use the server.
set(LINEFOLD_CORE
    "$<LINK_GROUP:RESCAN,carrier,files,voicemail,location,heartbeat,lasd,helper_server>")

# Optimising a test takes longer than running it, and g++ 12 sees overruns in inlined strings that are
# none.
set(LINEFOLD_TEST_OPTIONS -O0)

# linefold_test_program(NAME SOURCES... LIBS...): a GoogleTest binary. Its headers are compiled once
# for all of them.
function(linefold_test_program)
    cmake_parse_arguments(ARG "" "NAME" "SOURCES;LIBS" ${ARGN})
    add_executable(${ARG_NAME} ${ARG_SOURCES})
    target_include_directories(${ARG_NAME} PRIVATE ${CMAKE_SOURCE_DIR})
    target_compile_options(${ARG_NAME} PRIVATE ${LINEFOLD_TEST_OPTIONS})
    target_link_libraries(${ARG_NAME} PRIVATE ${ARG_LIBS} GTest::gtest GTest::gtest_main)
    if(NOT TARGET test_headers)
        # A program, since what uses the headers are programs.
        add_executable(test_headers ${CMAKE_SOURCE_DIR}/tests/support/TestHeaders.cpp)
        target_compile_options(test_headers PRIVATE ${LINEFOLD_TEST_OPTIONS})
        target_link_libraries(test_headers PRIVATE GTest::gtest GTest::gtest_main)
        target_precompile_headers(test_headers PRIVATE
            <gtest/gtest.h> <filesystem> <functional> <map> <span> <string> <vector>)
    endif()
    target_precompile_headers(${ARG_NAME} REUSE_FROM test_headers)
    add_dependencies(tests-all ${ARG_NAME})
endfunction()

# linefold_test(NAME SOURCES... LIBS...): the same, registered as one test.
function(linefold_test)
    cmake_parse_arguments(ARG "" "NAME" "" ${ARGN})
    linefold_test_program(${ARGN})
    add_test(NAME ${ARG_NAME} COMMAND ${ARG_NAME})
    set_tests_properties(${ARG_NAME} PROPERTIES TIMEOUT 300)
endfunction()
