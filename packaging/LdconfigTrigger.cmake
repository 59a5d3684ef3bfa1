# CPack lets the library's package call ldconfig by scripts, one of which would be left behind when the package is removed.
# A trigger does the same and goes with the package.
foreach(package IN LISTS CPACK_PACKAGE_FILES)
  if(package MATCHES "/libkdd[0-9]+_[^/]*\\.deb$")
    set(unpacked ${package}.unpacked)
    file(REMOVE_RECURSE ${unpacked})
    execute_process(COMMAND dpkg-deb -R ${package} ${unpacked} COMMAND_ERROR_IS_FATAL ANY)
    file(REMOVE ${unpacked}/DEBIAN/postinst ${unpacked}/DEBIAN/postrm)
    file(WRITE ${unpacked}/DEBIAN/triggers "activate-noawait ldconfig\n")
    file(CHMOD ${unpacked}/DEBIAN/triggers PERMISSIONS OWNER_READ OWNER_WRITE GROUP_READ WORLD_READ)
    execute_process(COMMAND dpkg-deb --root-owner-group -b ${unpacked} ${package}
      OUTPUT_QUIET COMMAND_ERROR_IS_FATAL ANY)
    file(REMOVE_RECURSE ${unpacked})
  endif()
endforeach()
