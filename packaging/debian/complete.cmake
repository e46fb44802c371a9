# Run by CPack between installing and packing: completes each package's files by what Debian wants in
# every package, packs manual pages, and takes out the RUNPATHs, which nothing under /usr needs.
set(names_runtime libzeloqrmclient1)
set(names_devel libzeloqrmclient-dev)
set(names_tools zeloqrm-tools)
foreach(component IN LISTS CPACK_COMPONENTS_ALL)
    set(folder ${CPACK_TEMPORARY_DIRECTORY}/${component}/usr)
    set(documents ${folder}/share/doc/${names_${component}})
    file(COPY ${CMAKE_CURRENT_LIST_DIR}/copyright DESTINATION ${documents}
        FILE_PERMISSIONS OWNER_READ OWNER_WRITE GROUP_READ WORLD_READ)
    execute_process(COMMAND gzip -9nc ${CMAKE_CURRENT_LIST_DIR}/changelog
        OUTPUT_FILE ${documents}/changelog.gz COMMAND_ERROR_IS_FATAL ANY)
    file(GLOB manual_pages ${folder}/share/man/man*/*.[1-8])
    if(manual_pages)
        execute_process(COMMAND gzip -9n ${manual_pages} COMMAND_ERROR_IS_FATAL ANY)
    endif()
    file(GLOB_RECURSE linked ${folder}/bin/qrm* ${folder}/lib/*.so.*)
    foreach(file IN LISTS linked)
        if(NOT IS_SYMLINK ${file})
            file(RPATH_REMOVE FILE ${file})
        endif()
    endforeach()
endforeach()
