# Runs between staging and packing: compresses what Debian keeps compressed, without a time stamp, makes
# folders the same whatever the umask was, and names the prefix, as packages do not move: pkg-config
# leaves out the system's own folders only when it knows them by name.
file(GLOB_RECURSE pages ${CPACK_TEMPORARY_DIRECTORY}/*/usr/share/man/*
    ${CPACK_TEMPORARY_DIRECTORY}/*/usr/share/doc/*/changelog.Debian
    ${CPACK_TEMPORARY_DIRECTORY}/*/usr/share/doc/*/README.md)
execute_process(COMMAND gzip -9n ${pages} COMMAND_ERROR_IS_FATAL ANY)
execute_process(COMMAND find ${CPACK_TEMPORARY_DIRECTORY} -type d -exec chmod 755 {} +
    COMMAND_ERROR_IS_FATAL ANY)
execute_process(COMMAND find ${CPACK_TEMPORARY_DIRECTORY} -name tavischeduler.pc
    -exec sed -i "s,^prefix=.*,prefix=${CPACK_PACKAGING_INSTALL_PREFIX}," {} +
    COMMAND_ERROR_IS_FATAL ANY)
