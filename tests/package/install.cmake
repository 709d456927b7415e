# Installs BUILD below WORK and moves the result to PREFIX, so that no path of the first place serves.
file(REMOVE_RECURSE ${WORK})
execute_process(COMMAND ${CMAKE_COMMAND} --install ${BUILD} --prefix ${WORK}/installed
                COMMAND_ERROR_IS_FATAL ANY)
file(RENAME ${WORK}/installed ${PREFIX})
