# Installs the boot unit with the program's path as systemd reads it: quoted, for blanks, and with
# specifiers escaped. Of an executable's path systemd takes no quote and no backslash at all.
foreach(path CMAKE_INSTALL_SBINDIR MIRA_UNIT_DIR)
    cmake_path(ABSOLUTE_PATH ${path} BASE_DIRECTORY "${CMAKE_INSTALL_PREFIX}")
endforeach()
set(program "${CMAKE_INSTALL_SBINDIR}/mira_tzlinks")
if(program MATCHES [=[["'\]]=])
    message(FATAL_ERROR "systemd takes no quote or backslash in a path: ${program}")
endif()
string(REPLACE % %% program "${program}")
set(unit "${MIRA_UNIT_DIR}/mira_tzlinks.service")
message(STATUS "Installing: $ENV{DESTDIR}${unit}")
configure_file("${unit_source}" "$ENV{DESTDIR}${unit}" @ONLY NO_SOURCE_PERMISSIONS)
list(APPEND CMAKE_INSTALL_MANIFEST_FILES "${unit}")
