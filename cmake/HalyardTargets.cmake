# Warnings and sanitizers for every target of ours, and the two shapes of target
# that the source folders are made of.

add_library(halyard_options INTERFACE)
target_compile_options(halyard_options INTERFACE
  -Wall -Wextra -Wpedantic -Wconversion -Wshadow -Wnon-virtual-dtor -Wold-style-cast
  -Wimplicit-fallthrough -Werror)
target_include_directories(halyard_options INTERFACE ${PROJECT_SOURCE_DIR}/src)
target_compile_definitions(halyard_options INTERFACE
  HALYARD_VERSION="${PROJECT_VERSION}")
if(CMAKE_CXX_COMPILER_ID MATCHES Clang)
  target_compile_options(halyard_options INTERFACE -Wthread-safety)
else()
  # Nobody replaces our functions at load time, so position-independent code may
  # inline them all the same (clang does so anyway).
  target_compile_options(halyard_options INTERFACE -fno-semantic-interposition)
endif()
if(HALYARD_SANITIZE)
  target_compile_options(halyard_options INTERFACE
    -fsanitize=${HALYARD_SANITIZE} -fno-omit-frame-pointer -fno-sanitize-recover=all)
  target_link_options(halyard_options INTERFACE -fsanitize=${HALYARD_SANITIZE})
  if(HALYARD_SANITIZE MATCHES thread AND CMAKE_CXX_COMPILER_ID STREQUAL GNU)
    # asio's fences, which gcc's ThreadSanitizer does not model, from its headers.
    target_compile_options(halyard_options INTERFACE -Wno-tsan)
  endif()
endif()

# halyard_folder(NAME [DEPENDS target...] [EXCLUDE file...])
#
# The static library halyard_NAME out of this folder's sources and, with tests
# on, the program test_NAME out of its *_test.cpp.
function(halyard_folder name)
  cmake_parse_arguments(arg "" "" "DEPENDS;EXCLUDE;TEST_DEPENDS" ${ARGN})
  file(GLOB sources CONFIGURE_DEPENDS ${CMAKE_CURRENT_SOURCE_DIR}/*.cpp)
  set(tests ${sources})
  list(FILTER sources EXCLUDE REGEX "_test\\.cpp$")
  list(FILTER tests INCLUDE REGEX "_test\\.cpp$")
  foreach(file ${arg_EXCLUDE})
    list(REMOVE_ITEM sources ${CMAKE_CURRENT_SOURCE_DIR}/${file})
  endforeach()
  add_library(halyard_${name} STATIC ${sources})
  target_link_libraries(halyard_${name} PUBLIC halyard_options ${arg_DEPENDS})
  if(HALYARD_TESTS AND tests)
    halyard_test(test_${name} ${tests})
    target_link_libraries(test_${name} PRIVATE halyard_${name} ${arg_TEST_DEPENDS})
  endif()
endfunction()

# halyard_test(NAME source...): a GoogleTest program whose cases ctest lists. Those
# that the filter NAME_serial names run while no other test does.
function(halyard_test name)
  find_package(GTest REQUIRED)
  include(GoogleTest)
  add_executable(${name} ${ARGN})
  target_link_libraries(${name} PRIVATE halyard_options GTest::gmock GTest::gtest_main)
  if(CMAKE_CXX_COMPILER_ID STREQUAL GNU AND CMAKE_CXX_COMPILER_VERSION VERSION_LESS 13)
    # Its optimiser takes "text" + std::string() for overlapping (gcc bug 105651).
    target_compile_options(${name} PRIVATE $<$<CONFIG:Release>:-Wno-restrict>)
  endif()
  if(DEFINED ${name}_serial)
    gtest_discover_tests(${name} DISCOVERY_TIMEOUT 60 TEST_FILTER "${${name}_serial}"
      TEST_LIST ${name}_serial_TESTS PROPERTIES TIMEOUT 120 RUN_SERIAL TRUE)
    set(others TEST_FILTER "-${${name}_serial}")
  endif()
  gtest_discover_tests(${name} DISCOVERY_TIMEOUT 60 ${others} PROPERTIES TIMEOUT 120)
endfunction()

# halyard_uses_rapidjson(file...): its stack adds to a null pointer before it has
# grown for the first time, which clang's sanitizer tells of. Every source of a
# program counts that uses it, since the linker takes any one's copy.
function(halyard_uses_rapidjson)
  if((HALYARD_SANITIZE MATCHES undefined OR HALYARD_FUZZERS) AND CMAKE_CXX_COMPILER_ID MATCHES Clang)
    set_source_files_properties(${ARGN} PROPERTIES COMPILE_OPTIONS -fno-sanitize=pointer-overflow)
  endif()
endfunction()
