# What a builder may choose, and the compiler settings that follow from it.

option(LINEFOLD_WARNINGS_AS_ERRORS "Warnings end the build" OFF)
option(LINEFOLD_FUZZ "Build the fuzzers (clang)" OFF)
set(LINEFOLD_SANITIZE "" CACHE STRING "Sanitizers to build with, such as address,undefined")

# Constants of the built daemon; platform/BuildConstants.h.in hands them to the code. There is no
# run-time override.
set(LINEFOLD_CONFIGURATION_HOST "configuration.vendra.example" CACHE STRING
    "Host of the index server of the service databases")
set(LINEFOLD_HEARTBEAT_HOST "192.0.2.1" CACHE STRING "IPv4 address that the heartbeat pings")
set(LINEFOLD_LIBRARY_DIR "/usr/lib/linefold" CACHE STRING "Folder of modules loaded when used")
set(LINEFOLD_CONFIGURATION_DIR "/etc/linefold" CACHE STRING "Folder of the configuration files")
set(LINEFOLD_DEFAULT_GROUP "linefold-telephony" CACHE STRING
    "Entitled group that lfhelper takes when root starts it")
set(LINEFOLD_IDLE_INTERVAL "10.0" CACHE STRING "Seconds without work until the daemon leaves")
set(LINEFOLD_HTTP_CONNECT_TIMEOUT_MS "30000" CACHE STRING
    "Milliseconds until a server must be connected to")
set(LINEFOLD_HTTP_STALL_TIMEOUT "60" CACHE STRING
    "Seconds that a server may send less than 1 byte a second")
set(LINEFOLD_HTTP_TOTAL_TIMEOUT "3600" CACHE STRING "Seconds until a server must have sent all")

set(CMAKE_CXX_FLAGS_RELEASE "-O2 -DNDEBUG")

add_compile_options(
    -Wall -Wextra -Wpedantic -Wconversion -Wshadow -Wimplicit-fallthrough
    $<$<COMPILE_LANGUAGE:CXX>:-Wnon-virtual-dtor> $<$<COMPILE_LANGUAGE:CXX>:-Woverloaded-virtual>
    # Neither logs nor binaries tell where they were built.
    -ffile-prefix-map=${CMAKE_SOURCE_DIR}/=
)
if(CMAKE_CXX_COMPILER_ID STREQUAL "Clang")
    add_compile_options($<$<COMPILE_LANGUAGE:CXX>:-Wthread-safety>)
endif()
if(LINEFOLD_WARNINGS_AS_ERRORS)
    add_compile_options(-Werror)
endif()
if(LINEFOLD_FUZZ)
    add_compile_options(-fsanitize=fuzzer-no-link)
endif()
if(LINEFOLD_SANITIZE)
    # Code that checks addresses takes longer to optimise than to run; that of threads is run longer.
    if(LINEFOLD_SANITIZE MATCHES "thread")
        set(sanitizer_optimisation -O1)
    else()
        set(sanitizer_optimisation -O0)
    endif()
    add_compile_options(-fsanitize=${LINEFOLD_SANITIZE} -fno-omit-frame-pointer
                        -fno-sanitize-recover=all ${sanitizer_optimisation} -g1)
    add_link_options(-fsanitize=${LINEFOLD_SANITIZE})
    if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
        # What the sanitizers put into the code confuses this one; the other builds have it.
        add_compile_options(-Wno-maybe-uninitialized)
    endif()
else()
    # The shipped programs bring the compiler's libraries along: a cold start finds less to load.
    add_compile_options(-ffunction-sections -fdata-sections)
    add_link_options(-Wl,--gc-sections -Wl,-z,relro,-z,now)
endif()
