# What makes a fault of memory harder to turn into more, as Debian builds its own packages. Sanitizers look for the same faults
# by themselves, and the C library checks calls in optimised code only.
if(NOT KDD_SANITIZE)
  add_compile_options(-fstack-protector-strong -fstack-clash-protection)
  if(CMAKE_SYSTEM_PROCESSOR MATCHES "x86_64|AMD64")
    add_compile_options(-fcf-protection)
  endif()
  add_compile_definitions($<$<NOT:$<CONFIG:Debug>>:_FORTIFY_SOURCE=2>)
  # All that is looked up by name is looked up at the start, and cannot be written to afterwards.
  add_link_options(-Wl,-z,relro -Wl,-z,now)
endif()
