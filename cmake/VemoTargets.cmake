# How every target of this project is compiled.
find_program(VEMO_CCACHE ccache)
if(VEMO_CCACHE AND NOT CMAKE_CXX_COMPILER_LAUNCHER)
  set(CMAKE_CXX_COMPILER_LAUNCHER ${VEMO_CCACHE})
endif()

add_library(vemo_options INTERFACE)
target_compile_features(vemo_options INTERFACE cxx_std_20)
target_include_directories(vemo_options INTERFACE ${PROJECT_SOURCE_DIR})
target_compile_options(vemo_options INTERFACE -Wall -Wextra -Wpedantic -Wshadow -Wnon-virtual-dtor)
if(VEMO_WERROR)
  target_compile_options(vemo_options INTERFACE -Werror)
endif()
if(NOT VEMO_ASSERTIONS)
  target_compile_definitions(vemo_options INTERFACE VEMO_NO_ASSERTIONS)
endif()
if(VEMO_SANITIZE)
  target_compile_options(vemo_options INTERFACE -fsanitize=${VEMO_SANITIZE} -fno-sanitize-recover=all
                                                -fno-omit-frame-pointer)
  target_link_options(vemo_options INTERFACE -fsanitize=${VEMO_SANITIZE})
endif()

# vemo_test(NAME LIBRARIES... SOURCES...): one test program, registered with CTest and listed for ./test.
function(vemo_test name)
  cmake_parse_arguments(TEST "" "" "SOURCES;LIBRARIES" ${ARGN})
  add_executable(${name} ${TEST_SOURCES})
  target_link_libraries(${name} PRIVATE ${TEST_LIBRARIES} vemo_options GTest::gtest GTest::gtest_main)
  target_compile_definitions(${name} PRIVATE VEMO_SOURCE_DIR="${PROJECT_SOURCE_DIR}"
                                             VEMO_BINARY_DIR="${PROJECT_BINARY_DIR}")
  set_target_properties(${name} PROPERTIES RUNTIME_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR}/tests)
  add_test(NAME ${name} COMMAND ${name})
  set_property(GLOBAL APPEND_STRING PROPERTY VEMO_TEST_PROGRAMS "${PROJECT_BINARY_DIR}/tests/${name}\n")
endfunction()

# Writes the list of test programs that ./test runs.
function(vemo_list_tests)
  get_property(programs GLOBAL PROPERTY VEMO_TEST_PROGRAMS)
  file(WRITE ${PROJECT_BINARY_DIR}/tests/programs.txt "${programs}")
endfunction()
