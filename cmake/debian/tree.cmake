# Run by cpack on the trees of all packages before they are packed: adds the copyright file and the
# changelog, names the folder of documents after the package, and compresses the manual pages.
string(TIMESTAMP now "%s" UTC)  # SOURCE_DATE_EPOCH if set

function(run)
    execute_process(COMMAND ${ARGV} COMMAND_ERROR_IS_FATAL ANY)
endfunction()

foreach(component ${CPACK_COMPONENTS_ALL})
    set(tree ${CPACK_TEMPORARY_DIRECTORY}/${component}/usr)
    string(TOUPPER ${component} component)
    set(package ${CPACK_DEBIAN_${component}_PACKAGE_NAME})
    set(doc ${tree}/share/doc/${package})

    if(EXISTS ${tree}/share/doc/imgfile AND NOT EXISTS ${doc})
        file(RENAME ${tree}/share/doc/imgfile ${doc})
    endif()
    file(MAKE_DIRECTORY ${doc})
    run(awk -v name=${CPACK_PACKAGE_NAME}
        -f ${CMAKE_CURRENT_LIST_DIR}/copyright.awk ${CMAKE_CURRENT_LIST_DIR}/../../LICENSE
        OUTPUT_FILE ${doc}/copyright)
    run(awk -v source=${CPACK_DEBIAN_PACKAGE_SOURCE} -v maintainer=${CPACK_PACKAGE_CONTACT}
        -v now=${now}
        -f ${CMAKE_CURRENT_LIST_DIR}/changelog.awk ${CMAKE_CURRENT_LIST_DIR}/../../CHANGELOG.md
        OUTPUT_FILE ${doc}/changelog)

    file(GLOB_RECURSE pages ${tree}/share/man/*)
    run(gzip -9n ${doc}/changelog ${pages})
endforeach()
