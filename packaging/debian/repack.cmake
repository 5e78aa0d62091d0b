# Packs the finished package again, so that it depends on neither the time nor the umask: everything
# in it bears the date of its changelog.
execute_process(
    COMMAND sh -euc [[
        umask 022
        date=$(grep -m 1 '^ -- ' "$1")
        date=${date#*>}
        SOURCE_DATE_EPOCH=$(date --date="$date" +%s)
        export SOURCE_DATE_EPOCH
        dpkg-deb --raw-extract "$2" "$3"
        find "$3" -type d -exec chmod 755 {} +
        find "$3" -exec touch --no-dereference --date="$date" {} +
        dpkg-deb --root-owner-group --build "$3" "$2"
    ]] - ${CMAKE_CURRENT_LIST_DIR}/changelog ${CPACK_PACKAGE_FILES} ${CPACK_TEMPORARY_DIRECTORY}/again
    COMMAND_ERROR_IS_FATAL ANY
)
