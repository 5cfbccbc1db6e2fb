# How the targets of this project are compiled.
#
# vemo_options is what a user of the libraries needs too: it is part of their interface and is installed with them.
# vemo_build is what only this build needs, warnings above all, and never leaves it.
add_library(vemo_options INTERFACE)
set_target_properties(vemo_options PROPERTIES EXPORT_NAME options)
target_compile_features(vemo_options INTERFACE cxx_std_20)
target_include_directories(vemo_options INTERFACE $<BUILD_INTERFACE:${PROJECT_SOURCE_DIR}>
                                                  $<INSTALL_INTERFACE:${VEMO_INSTALL_INCLUDEDIR}>)
if(NOT VEMO_ASSERTIONS)
  target_compile_definitions(vemo_options INTERFACE VEMO_NO_ASSERTIONS)
endif()

add_library(vemo_build INTERFACE)
target_compile_options(vemo_build INTERFACE -Wall -Wextra -Wpedantic -Wshadow -Wnon-virtual-dtor)
if(VEMO_WERROR)
  target_compile_options(vemo_build INTERFACE -Werror)
endif()
if(VEMO_SANITIZE)
  # Optimised a little: the checks make code slow enough to compile and to run.
  target_compile_options(vemo_build INTERFACE -fsanitize=${VEMO_SANITIZE} -fno-sanitize-recover=all
                                              -fno-omit-frame-pointer -O1 -g1)
  target_link_options(vemo_build INTERFACE -fsanitize=${VEMO_SANITIZE})
endif()

# A build of this project alone has line numbers but no descriptions of types, which take a third of the compiler's time.
if(PROJECT_IS_TOP_LEVEL)
  set(CMAKE_CXX_FLAGS_RELWITHDEBINFO "-O2 -g1 -DNDEBUG")
endif()

# A build of this project alone uses ccache where there is one. Inside another project, that is the other's affair.
if(PROJECT_IS_TOP_LEVEL AND NOT CMAKE_CXX_COMPILER_LAUNCHER)
  find_program(VEMO_CCACHE ccache)
  if(VEMO_CCACHE)
    set(CMAKE_CXX_COMPILER_LAUNCHER ${VEMO_CCACHE})
  endif()
endif()

# Static and shared libraries.
#
# The module (vemo_maps) is static always: its host is a set of undefined symbols that each program defines once, and a
# shared library that left them open could not be checked by the linker. A shared vemo_store contains the whole module,
# bound to its own host; a program that uses it does not link vemo::maps beside it. vemo::maps stays there for programs
# with a host of their own. In the same way a shared vemo_store contains the engines, a shared vemo_history the edit
# sources.

# Where libraries above the module take it from.
if(BUILD_SHARED_LIBS)
  set(VEMO_MODULE vemo_store)
else()
  set(VEMO_MODULE vemo_maps)
endif()

# vemo_library(NAME): what the libraries have in common. They are installed as vemo::NAME, less the prefix of NAME.
function(vemo_library name)
  string(REGEX REPLACE "^vemo_" "" export_name ${name})
  add_library(vemo::${export_name} ALIAS ${name})
  target_link_libraries(${name} PUBLIC vemo_options PRIVATE $<BUILD_INTERFACE:vemo_build>)
  if(VEMO_FUZZ)  # so that the fuzzer sees which way an input took
    target_compile_options(${name} PRIVATE -fsanitize=fuzzer-no-link)
  endif()
  # The sonames carry the minor version while the major one is 0: any minor version may change the interface.
  set_target_properties(${name} PROPERTIES
    EXPORT_NAME ${export_name}
    POSITION_INDEPENDENT_CODE ON
    VERSION ${PROJECT_VERSION}
    SOVERSION ${PROJECT_VERSION_MAJOR}.${PROJECT_VERSION_MINOR})
endfunction()

# vemo_contains(NAME PART): links the static library PART into NAME, whole if NAME is a shared library.
function(vemo_contains name part)
  if(BUILD_SHARED_LIBS)
    target_link_libraries(${name} PRIVATE $<LINK_LIBRARY:WHOLE_ARCHIVE,${part}>)
  else()
    target_link_libraries(${name} PUBLIC ${part})
  endif()
endfunction()

# vemo_test(NAME LIBRARIES... SOURCES...): one test program, registered with CTest and listed for ./test.
function(vemo_test name)
  cmake_parse_arguments(TEST "" "" "SOURCES;LIBRARIES" ${ARGN})
  add_executable(${name} ${TEST_SOURCES})
  target_link_libraries(${name} PRIVATE ${TEST_LIBRARIES} vemo_options vemo_build GTest::gtest GTest::gtest_main)
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
