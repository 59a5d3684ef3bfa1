# One interface target that every target of ours links: warnings, sanitizers, coverage.
set(KDD_SANITIZE "" CACHE STRING "Sanitizers to build with, for example address,undefined")
option(KDD_COVERAGE "Count how often each line and branch runs; asks for GCC" OFF)

add_library(kdd_options INTERFACE)
target_compile_options(kdd_options INTERFACE
  -Wall -Wextra -Wpedantic -Wshadow -Wconversion -Wsign-conversion -Werror
  $<$<COMPILE_LANGUAGE:CXX>:-Wnon-virtual-dtor -Woverloaded-virtual>)
target_compile_definitions(kdd_options INTERFACE
  QT_NO_CAST_FROM_ASCII QT_NO_CAST_TO_ASCII QT_NO_URL_CAST_FROM_STRING QT_NO_FOREACH)
if(KDD_SANITIZE)
  target_compile_options(kdd_options INTERFACE -fsanitize=${KDD_SANITIZE} -fno-sanitize-recover=all
    -fno-omit-frame-pointer)
  target_link_options(kdd_options INTERFACE -fsanitize=${KDD_SANITIZE})
  if(CMAKE_CXX_COMPILER_ID MATCHES "Clang")
    # Clang leaves the sanitizers' run time to the program that loads a shared library.
    target_link_options(kdd_options INTERFACE
      $<$<IN_LIST:$<TARGET_PROPERTY:TYPE>,SHARED_LIBRARY$<SEMICOLON>MODULE_LIBRARY>:-Wl,-z,undefs>)
  endif()
endif()
if(KDD_COVERAGE)
  # Tests too: of an inline function that both have, a test's program would else keep the one that does not count. Several
  # threads count at once.
  target_compile_options(kdd_options INTERFACE --coverage -fprofile-abs-path -fprofile-update=atomic)
  target_link_options(kdd_options INTERFACE --coverage)
endif()
if(KDD_FUZZ)
  # The fuzzer sees where its inputs lead; tests of the same build are not hindered by it.
  target_compile_options(kdd_options INTERFACE -fsanitize=fuzzer-no-link)
endif()

find_program(CCACHE ccache)
if(CCACHE AND NOT CMAKE_CXX_COMPILER_LAUNCHER)
  set(CMAKE_CXX_COMPILER_LAUNCHER ${CCACHE})
endif()
