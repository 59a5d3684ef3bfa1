# The public headers as they are installed, in ${PROJECT_BINARY_DIR}/include/kddlib. Whatever uses the library as others
# do builds against these and sees nothing else of it.
include(${PROJECT_SOURCE_DIR}/src/PublicHeaders.cmake)

function(kdd_public_headers target)
  set(script ${PROJECT_SOURCE_DIR}/cmake/WritePublicHeaders.cmake)
  set(list ${PROJECT_SOURCE_DIR}/src/PublicHeaders.cmake)
  set(folder ${PROJECT_BINARY_DIR}/include/kddlib)
  set(stamp ${PROJECT_BINARY_DIR}/include/written)
  set_property(DIRECTORY APPEND PROPERTY CMAKE_CONFIGURE_DEPENDS ${list})
  list(TRANSFORM KDD_PUBLIC_HEADERS PREPEND ${PROJECT_SOURCE_DIR}/src/ OUTPUT_VARIABLE sources)
  list(TRANSFORM KDD_PUBLIC_HEADERS REPLACE "^.*/" "" OUTPUT_VARIABLE names)
  list(TRANSFORM names PREPEND ${folder}/ OUTPUT_VARIABLE written)
  add_custom_command(OUTPUT ${stamp} BYPRODUCTS ${written}
    COMMAND ${CMAKE_COMMAND} -DLIST=${list} -DSOURCE=${PROJECT_SOURCE_DIR}/src -DFOLDER=${folder} -DSTAMP=${stamp}
      -P ${script}
    DEPENDS ${sources} ${list} ${script}
    COMMENT "Writing the public headers"
    VERBATIM)
  add_custom_target(${target} ALL DEPENDS ${stamp})
  install(DIRECTORY ${folder} DESTINATION ${CMAKE_INSTALL_INCLUDEDIR} COMPONENT development)
endfunction()

# Compiles every header of a list alone, so that none needs another one to be included before it.
function(kdd_headers_compile_alone target)
  set(sources "")
  foreach(header IN LISTS KDD_PUBLIC_HEADERS)
    cmake_path(GET header STEM name)
    set(source "${CMAKE_CURRENT_BINARY_DIR}/headers/${name}.cpp")
    file(CONFIGURE OUTPUT "${source}" CONTENT "#include <kddlib/${name}.h>\n#include <kddlib/${name}.h>\n" @ONLY)
    list(APPEND sources "${source}")
  endforeach()
  add_library(${target}_headers OBJECT ${sources})
  target_link_libraries(${target}_headers PRIVATE kdd_options ${target})
endfunction()
