# Run by CPack on the staging tree, after the install and before the .deb is
# made (CPACK_PRE_BUILD_SCRIPTS): what Debian asks of a package beyond what
# the install rules install.
set(prefix ${CPACK_TEMPORARY_INSTALL_DIRECTORY}${CPACK_PACKAGING_INSTALL_PREFIX})
if(NOT IS_DIRECTORY ${prefix}/bin)
    message(FATAL_ERROR "no staged programs under ${prefix}")
endif()
set(doc ${prefix}/share/doc/${CPACK_PACKAGE_NAME})
file(MAKE_DIRECTORY ${doc})

# gzip -9n: the best compression, and no name or time stamp in the file, so
# that the same sources give the same package.
function(gzip_file file)
    execute_process(COMMAND gzip -9nf ${file} RESULT_VARIABLE result)
    if(NOT result EQUAL 0)
        message(FATAL_ERROR "gzip ${file} failed: ${result}")
    endif()
endfunction()

# The install rules install man pages as written (man reads them so); a
# package ships them compressed.
file(GLOB_RECURSE pages ${prefix}/share/man/*.[1-9])
foreach(page IN LISTS pages)
    gzip_file(${page})
endforeach()

file(COPY ${CPACK_FTPCONFIG_SOURCE_DIR}/cmake/debian-copyright DESTINATION ${doc})
file(RENAME ${doc}/debian-copyright ${doc}/copyright)

# One entry per version: the package is built from the sources, not
# maintained apart from them. The date honours SOURCE_DATE_EPOCH.
string(TIMESTAMP date "%a, %d %b %Y %H:%M:%S +0000" UTC)
set(version ${CPACK_PACKAGE_VERSION}-${CPACK_DEBIAN_PACKAGE_RELEASE})
file(WRITE ${doc}/changelog.Debian
"${CPACK_PACKAGE_NAME} (${version}) unstable; urgency=medium

  * Release ${CPACK_PACKAGE_VERSION}, packaged with CPack from the sources.

 -- ${CPACK_PACKAGE_CONTACT}  ${date}
")
gzip_file(${doc}/changelog.Debian)

# Whatever the builder's umask, files are 0644 and directories 0755
# (programs keep their 0755).
file(GLOB_RECURSE entries LIST_DIRECTORIES true ${CPACK_TEMPORARY_INSTALL_DIRECTORY}/*)
foreach(entry IN LISTS entries)
    if(IS_DIRECTORY ${entry})
        file(CHMOD ${entry} PERMISSIONS OWNER_READ OWNER_WRITE OWNER_EXECUTE GROUP_READ GROUP_EXECUTE
            WORLD_READ WORLD_EXECUTE)
    elseif(NOT entry MATCHES "/bin/[^/]+$")
        file(CHMOD ${entry} PERMISSIONS OWNER_READ OWNER_WRITE GROUP_READ WORLD_READ)
    endif()
endforeach()
