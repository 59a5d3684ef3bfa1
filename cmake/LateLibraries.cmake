# Libraries that are loaded when something of them is first called: src/platform/late tells how.
if(CMAKE_SYSTEM_PROCESSOR STREQUAL "x86_64")
  option(KDD_LATE_LIBRARIES "Load what reading tag files does not need when it is first called; else link it" ON)
else()
  set(KDD_LATE_LIBRARIES OFF)
endif()

# kdd_late(NAME LIBRARY): the target NAME has a library's headers, and links it only where it cannot be loaded late.
function(kdd_late name library)
  add_library(${name} INTERFACE)
  if(KDD_LATE_LIBRARIES)
    target_include_directories(${name} SYSTEM INTERFACE $<TARGET_PROPERTY:${library},INTERFACE_INCLUDE_DIRECTORIES>)
    target_compile_definitions(${name} INTERFACE $<TARGET_PROPERTY:${library},INTERFACE_COMPILE_DEFINITIONS>)
  else()
    target_link_libraries(${name} INTERFACE ${library})
  endif()
endfunction()

kdd_late(late_codecs_jpeg DCMTK::dcmjpeg)
kdd_late(late_codecs_jpegls DCMTK::dcmjpls)
kdd_late(late_codecs_openjpeg PkgConfig::OPENJPEG)
kdd_late(late_crypto OpenSSL::Crypto)
kdd_late(late_curl CURL::libcurl)
kdd_late(late_database Qt5::Sql)
kdd_late(late_hdf5 hdf5::hdf5)
kdd_late(late_pictures Qt5::Gui)
kdd_late(late_postgresql PkgConfig::LIBPQ)

# What the checker of dynamic types asks for are the types of classes, which are no functions. For sources that use classes
# of such libraries, of a target that is made in its own folder.
function(kdd_leave_types_unchecked target)
  if(KDD_LATE_LIBRARIES AND KDD_SANITIZE MATCHES "undefined")
    set_source_files_properties(${ARGN} TARGET_DIRECTORY ${target} PROPERTIES COMPILE_OPTIONS -fno-sanitize=vptr)
  endif()
endfunction()
