# Makes of an installed tree what Debian asks of a package beyond it: documentation under the name
# of the package, with a changelog and a copyright file, and both changelog and manual compressed.
set(share ${CPACK_TEMPORARY_INSTALL_DIRECTORY}/usr/share)
file(RENAME ${share}/doc/mira_tzlinks ${share}/doc/mira-tzlinks)
file(COPY ${CMAKE_CURRENT_LIST_DIR}/changelog ${CMAKE_CURRENT_LIST_DIR}/copyright
    DESTINATION ${share}/doc/mira-tzlinks NO_SOURCE_PERMISSIONS)
execute_process(
    COMMAND gzip -9n ${share}/doc/mira-tzlinks/changelog ${share}/man/man8/mira_tzlinks.8
    COMMAND_ERROR_IS_FATAL ANY
)
