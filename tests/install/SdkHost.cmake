# Builds the third-party host in sdkhost/ against the SDK installed in PREFIX and serves one
# search through the installed plug-in; checks the installed pkg-config file too.
#   PREFIX, WORK_DIR, SOURCE_DIR, GENERATOR, CXX_COMPILER, COMPILER_LAUNCHER, PLUGIN
file(REMOVE_RECURSE ${WORK_DIR})
execute_process(COMMAND ${CMAKE_COMMAND} -S ${SOURCE_DIR} -B ${WORK_DIR} -G ${GENERATOR}
                        -DCMAKE_CXX_COMPILER=${CXX_COMPILER}
                        -DCMAKE_CXX_COMPILER_LAUNCHER=${COMPILER_LAUNCHER}
                        -DCMAKE_PREFIX_PATH=${PREFIX}
                OUTPUT_QUIET COMMAND_ERROR_IS_FATAL ANY)
execute_process(COMMAND ${CMAKE_COMMAND} --build ${WORK_DIR} OUTPUT_QUIET COMMAND_ERROR_IS_FATAL ANY)
execute_process(COMMAND env -i ${WORK_DIR}/sdkhost ${PLUGIN}
                OUTPUT_VARIABLE output COMMAND_ERROR_IS_FATAL ANY)
set(expected "plug-in: C758778662E44060AC6E2EC5C9AD349B
tunnel: C758778662E44060AC6E2EC5C9AD349B QryAlarmList
answer: last=1 code=0 alarms=A1
")
if(NOT output STREQUAL expected)
    message(FATAL_ERROR "sdkhost printed:\n${output}\nexpected:\n${expected}")
endif()

# pkg-config: the header folder, and Qt's flags through the Requires line.
execute_process(COMMAND env PKG_CONFIG_PATH=${PREFIX}/share/pkgconfig
                        pkg-config --cflags PluginServerInterface
                OUTPUT_VARIABLE cflags COMMAND_ERROR_IS_FATAL ANY)
string(REGEX MATCH "^-I([^ ]+) .*QtCore" qtFound "${cflags}")
if(NOT qtFound OR NOT EXISTS ${CMAKE_MATCH_1}/IPluginObjectBase.h)
    message(FATAL_ERROR "pkg-config gave no header folder and Qt: ${cflags}")
endif()
