# Compiler settings that every target of the project shares.
set(CMAKE_CXX_STANDARD 20)
set(CMAKE_CXX_STANDARD_REQUIRED ON)
set(CMAKE_CXX_EXTENSIONS OFF)
set(CMAKE_POSITION_INDEPENDENT_CODE ON)
set(CMAKE_CXX_VISIBILITY_PRESET hidden)
set(CMAKE_VISIBILITY_INLINES_HIDDEN ON)
set(CMAKE_RUNTIME_OUTPUT_DIRECTORY ${CMAKE_BINARY_DIR}/bin)
set(CMAKE_LIBRARY_OUTPUT_DIRECTORY ${CMAKE_BINARY_DIR}/lib)
set(CMAKE_ARCHIVE_OUTPUT_DIRECTORY ${CMAKE_BINARY_DIR}/lib)

find_program(CCACHE_PROGRAM ccache)
if(CCACHE_PROGRAM)
  set(CMAKE_CXX_COMPILER_LAUNCHER ${CCACHE_PROGRAM})
endif()

# Profiles and stack traces need line tables; full type information doubles the build time.
set(CMAKE_CXX_FLAGS_RELWITHDEBINFO "-O2 -g1 -DNDEBUG")

set(VESK_SANITIZE "" CACHE STRING "Sanitizers to build with, as for -fsanitize=")
option(VESK_WARNINGS_AS_ERRORS "Treat warnings as errors" OFF)

add_compile_options(-Wall -Wextra -Wpedantic -Wformat=2 -Wshadow -Wnon-virtual-dtor -Woverloaded-virtual)
if(CMAKE_CXX_COMPILER_ID MATCHES Clang)
  add_compile_options(-Wthread-safety -Wthread-safety-beta)
endif()
if(VESK_WARNINGS_AS_ERRORS)
  add_compile_options(-Werror)
endif()
if(VESK_SANITIZE)
  # -O1: the sanitized daemon still has to keep up with real sockets and TLS.
  if(VESK_SANITIZE MATCHES undefined)
    add_compile_options(-fsanitize=float-cast-overflow)  # not part of gcc's "undefined"
    add_link_options(-fsanitize=float-cast-overflow)
  endif()
  add_compile_options(-fsanitize=${VESK_SANITIZE} -fno-sanitize-recover=all -fno-omit-frame-pointer -O1 -g1)
  add_link_options(-fsanitize=${VESK_SANITIZE})
  if(VESK_SANITIZE MATCHES thread)
    # ThreadSanitizer doesn't understand fences; Boost.Asio's locks order its handlers without them.
    add_compile_definitions(BOOST_ASIO_DISABLE_FENCED_BLOCK)
  endif()
else()
  add_compile_options(-fstack-protector-strong)
  add_compile_definitions($<$<CONFIG:RelWithDebInfo>:_FORTIFY_SOURCE=2>)
  add_link_options(-Wl,-z,relro,-z,now)
endif()

include_directories(${PROJECT_SOURCE_DIR})

# vesk_library(NAME SOURCES… [LINK …]): a static library with the units of one directory.
function(vesk_library name)
  cmake_parse_arguments(ARG "" "" "SOURCES;LINK;PRIVATE" ${ARGN})
  add_library(${name} STATIC ${ARG_SOURCES})
  target_link_libraries(${name} PUBLIC ${ARG_LINK} PRIVATE ${ARG_PRIVATE})
endfunction()

# vesk_test(NAME [FIRST | LAST] SOURCES… LINK … [TIMEOUT …]): a GoogleTest program. In a parallel run, FIRST
# programs start before all others: quick tests of the system's purpose, so that a break shows at once. LAST
# programs are slow.
function(vesk_test name)
  cmake_parse_arguments(ARG "FIRST;LAST" "TIMEOUT" "SOURCES;LINK" ${ARGN})
  set(cost 50)
  if(ARG_FIRST)
    set(cost 100)
  elseif(ARG_LAST)
    set(cost 10)
  endif()
  if(NOT ARG_TIMEOUT)
    set(ARG_TIMEOUT 120)
  endif()
  add_executable(${name} ${ARG_SOURCES})
  target_link_libraries(${name} PRIVATE ${ARG_LINK} GTest::gtest GTest::gtest_main Threads::Threads)
  set_target_properties(${name} PROPERTIES RUNTIME_OUTPUT_DIRECTORY ${CMAKE_BINARY_DIR}/tests)
  # Optimising the assertions would take longer than running them.
  target_compile_options(${name} PRIVATE -O0 -U_FORTIFY_SOURCE)
  add_test(NAME ${name} COMMAND ${name})
  set_tests_properties(${name} PROPERTIES TIMEOUT ${ARG_TIMEOUT} COST ${cost})
endfunction()
