# One interface target that every target of ours links: warnings, sanitizers.
set(KDD_SANITIZE "" CACHE STRING "Sanitizers to build with, for example address,undefined")

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
endif()

find_program(CCACHE ccache)
if(CCACHE AND NOT CMAKE_CXX_COMPILER_LAUNCHER)
  set(CMAKE_CXX_COMPILER_LAUNCHER ${CCACHE})
endif()
