# Which lists of public headers are refused. SCRIPT writes them, FOLDER is a place to work in.
file(REMOVE_RECURSE ${FOLDER})
file(WRITE ${FOLDER}/src/core/kddlib/room/A.h "#pragma once\n#include \"platform/base/B.h\"\n#include <string>\n")
file(WRITE ${FOLDER}/src/platform/base/B.h "#pragma once\nint b[2]; // \"[;\"\n")
file(WRITE ${FOLDER}/src/platform/other/A.h "#pragma once\n")

# Writes the headers of a list; an empty reason stands for success.
function(expect reason)
  string(REPLACE ";" " " headers "${ARGN}")
  file(WRITE ${FOLDER}/list.cmake "set(KDD_PUBLIC_HEADERS ${headers})\n")
  execute_process(
    COMMAND ${CMAKE_COMMAND} -DLIST=${FOLDER}/list.cmake -DSOURCE=${FOLDER}/src -DFOLDER=${FOLDER}/written
      -DSTAMP=${FOLDER}/stamp -P ${SCRIPT}
    RESULT_VARIABLE code ERROR_VARIABLE said)
  string(REGEX REPLACE "[ \n]+" " " said "${said}")
  if(reason STREQUAL "" AND NOT code EQUAL 0)
    message(FATAL_ERROR "${headers} is refused: ${said}")
  elseif(NOT reason STREQUAL "" AND (code EQUAL 0 OR NOT said MATCHES "${reason}"))
    message(FATAL_ERROR "${headers} gives ${code} and not \"${reason}\": ${said}")
  endif()
endfunction()

expect("" core/kddlib/room/A.h platform/base/B.h)
foreach(name A B)
  file(READ ${FOLDER}/written/${name}.h ${name})
endforeach()
if(NOT A STREQUAL "#pragma once\n#include <kddlib/B.h>\n#include <string>\n")
  message(FATAL_ERROR "The includes are written as: ${A}")
endif()
if(NOT B STREQUAL "#pragma once\nint b[2]; // \"[;\"\n")
  message(FATAL_ERROR "What is no include has changed: ${B}")
endif()
expect("room/A.h is public but includes \"platform/base/B.h\", which is not" core/kddlib/room/A.h)
expect("Two public headers have the name A.h" core/kddlib/room/A.h platform/base/B.h platform/other/A.h)
expect("" platform/base/B.h)
if(EXISTS ${FOLDER}/written/A.h)
  message(FATAL_ERROR "A header that is not public any more is still there")
endif()
