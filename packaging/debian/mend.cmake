# Run by CPack on the finished packages. Takes out the maintainer scripts that it gives every package
# with a library: they run ldconfig, which the package's trigger does once for all packages. And names
# the libcurl that is needed: the dependency that CPack finds goes by the functions that are called,
# which are older than the options that they are given.
set(tree ${CPACK_TOPLEVEL_DIRECTORY}/repacked)
foreach(package IN LISTS CPACK_PACKAGE_FILES)
    file(REMOVE_RECURSE ${tree})
    execute_process(COMMAND dpkg-deb --raw-extract ${package} ${tree} COMMAND_ERROR_IS_FATAL ANY)
    file(REMOVE ${tree}/DEBIAN/postinst ${tree}/DEBIAN/postrm)
    file(READ ${tree}/DEBIAN/control control)
    string(REGEX REPLACE "(libcurl4[a-z0-9]*) \\(>= [^)]*\\)" "\\1 (>= ${CPACK_ZELO_CURL_VERSION})"
        control "${control}")
    file(WRITE ${tree}/DEBIAN/control "${control}")
    execute_process(COMMAND dpkg-deb --root-owner-group --build ${tree} ${package}
        OUTPUT_QUIET COMMAND_ERROR_IS_FATAL ANY)
endforeach()
