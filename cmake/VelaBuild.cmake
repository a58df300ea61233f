# How every target of this project is built.
include_guard()
find_package(Threads REQUIRED)

add_library(vela_options INTERFACE)
target_include_directories(vela_options INTERFACE ${PROJECT_SOURCE_DIR})
target_link_libraries(vela_options INTERFACE Threads::Threads)
target_compile_options(vela_options INTERFACE
  -Wall -Wextra -Wpedantic -Werror -Wshadow -Wconversion -Wsign-conversion -Wold-style-cast -Wnon-virtual-dtor
  -Woverloaded-virtual -Wcast-align -Wformat=2 -Wnull-dereference -Wimplicit-fallthrough -fno-omit-frame-pointer
  # Log lines carry the file's name and the journal its path: relative to the project, whoever builds it.
  -ffile-prefix-map=${PROJECT_SOURCE_DIR}/=)
if(CMAKE_CXX_COMPILER_ID STREQUAL "Clang")
  target_compile_options(vela_options INTERFACE -Wthread-safety -Werror=thread-safety -Wextra-semi -fsized-deallocation)
else()
  target_compile_options(vela_options INTERFACE -Wduplicated-cond -Wlogical-op)
endif()

if(VELA_SANITIZE)
  target_compile_options(vela_options INTERFACE -fsanitize=${VELA_SANITIZE} -fno-sanitize-recover=all)
  target_link_options(vela_options INTERFACE -fsanitize=${VELA_SANITIZE} -fno-sanitize-recover=all)
endif()

if(VELA_FUZZERS)
  # The libraries under test must count their branches too, or libFuzzer searches blindly.
  target_compile_options(vela_options INTERFACE -fsanitize=fuzzer-no-link)
endif()

if(VELA_HARDENING)
  set(CMAKE_POSITION_INDEPENDENT_CODE ON)
  target_compile_options(vela_options INTERFACE -fstack-protector-strong -fstack-clash-protection -fcf-protection
    -ftrivial-auto-var-init=zero $<$<NOT:$<CONFIG:Debug>>:-U_FORTIFY_SOURCE> $<$<NOT:$<CONFIG:Debug>>:-D_FORTIFY_SOURCE=2>
    -D_GLIBCXX_ASSERTIONS)
  target_link_options(vela_options INTERFACE -Wl,-z,relro,-z,now,-z,noexecstack
    $<$<STREQUAL:$<TARGET_PROPERTY:TYPE>,EXECUTABLE>:-pie>)
endif()

# vela_compile_alone(file...)
# For a room's sources whose own names (a helper, a constant) another source of the room has as well: presets that
# compile several sources together leave them out. The debug preset compiles every source by itself.
function(vela_compile_alone)
  set_source_files_properties(${ARGN} PROPERTIES SKIP_UNITY_BUILD_INCLUSION ON)
endfunction()

# vela_library(NAME SOURCES file... [HEADERS file...] [LINKS target...] [PRIVATE_LINKS target...])
# One room or one binding. Without sources it is an interface library of headers.
function(vela_library name)
  cmake_parse_arguments(PARSE_ARGV 1 arg "" "" "SOURCES;HEADERS;LINKS;PRIVATE_LINKS")
  if(arg_SOURCES)
    add_library(${name} STATIC ${arg_SOURCES})
    set(scope PUBLIC)
    target_link_libraries(${name} PUBLIC vela_options ${arg_LINKS} PRIVATE ${arg_PRIVATE_LINKS})
  else()
    add_library(${name} INTERFACE)
    set(scope INTERFACE)
    target_link_libraries(${name} INTERFACE vela_options ${arg_LINKS})
  endif()
  if(arg_HEADERS)
    target_sources(${name} ${scope} FILE_SET HEADERS BASE_DIRS ${PROJECT_SOURCE_DIR} FILES ${arg_HEADERS})
    set_target_properties(${name} PROPERTIES VERIFY_INTERFACE_HEADER_SETS ON)
  endif()
endfunction()

# vela_test(NAME SOURCES file... [LINKS target...] [LABELS label...])
# One GoogleTest program; every test of it is a test of its own for ctest.
function(vela_test name)
  if(NOT VELA_TESTS)
    return()
  endif()
  cmake_parse_arguments(PARSE_ARGV 1 arg "" "" "SOURCES;LINKS;LABELS")
  add_executable(${name} ${arg_SOURCES})
  target_link_libraries(${name} PRIVATE vela_options ${arg_LINKS} GTest::gmock GTest::gtest_main)
  # What is tested is built as its preset says; the tests themselves, two thirds of all compile time, need no speed.
  target_compile_options(${name} PRIVATE -O0 -g1)
  # A debug build pays for its checks; the time limit only ends what hangs.
  include(GoogleTest)
  gtest_discover_tests(${name} DISCOVERY_MODE PRE_TEST PROPERTIES TIMEOUT 300 LABELS "${arg_LABELS}")
endfunction()

# vela_fuzzer(NAME SOURCE file CORPUS folder [LINKS target...])
# A fuzz target (`extern "C" int LLVMFuzzerTestOneInput`). With VELA_FUZZERS it is a libFuzzer program. In every build the
# test NAME_replay runs it once over its corpus, through testing/ReplayCorpus.cpp.
function(vela_fuzzer name)
  cmake_parse_arguments(PARSE_ARGV 1 arg "" "SOURCE;CORPUS" "LINKS")
  if(VELA_FUZZERS)
    add_executable(${name} ${arg_SOURCE})
    target_compile_options(${name} PRIVATE -fsanitize=fuzzer)
    target_link_options(${name} PRIVATE -fsanitize=fuzzer)
    target_link_libraries(${name} PRIVATE vela_options ${arg_LINKS})
  endif()
  if(VELA_TESTS)
    add_executable(${name}_replay ${arg_SOURCE} ${PROJECT_SOURCE_DIR}/testing/ReplayCorpus.cpp)
    target_link_libraries(${name}_replay PRIVATE vela_options ${arg_LINKS})
    add_test(NAME ${name}_replay COMMAND ${name}_replay ${CMAKE_CURRENT_SOURCE_DIR}/${arg_CORPUS})
    set_tests_properties(${name}_replay PROPERTIES TIMEOUT 300 LABELS corpus)
  endif()
endfunction()

# vela_benchmark(NAME SOURCES file... [LINKS target...])
function(vela_benchmark name)
  if(NOT VELA_BENCHMARKS)
    return()
  endif()
  cmake_parse_arguments(PARSE_ARGV 1 arg "" "" "SOURCES;LINKS")
  add_executable(${name} ${arg_SOURCES})
  target_link_libraries(${name} PRIVATE vela_options ${arg_LINKS} benchmark::benchmark)
  set_target_properties(${name} PROPERTIES UNITY_BUILD OFF)
endfunction()
