# Installs the build into a scratch prefix; the installed alarmsearch must run its demo there
# with an empty environment, finding the installed plug-in by itself.
#   BUILD_DIR, PREFIX, PLUGIN_RELATIVE_DIR
file(REMOVE_RECURSE ${PREFIX})
execute_process(COMMAND ${CMAKE_COMMAND} --install ${BUILD_DIR} --prefix ${PREFIX}
                OUTPUT_QUIET COMMAND_ERROR_IS_FATAL ANY)
execute_process(COMMAND env -i ${PREFIX}/bin/alarmsearch demo
                RESULT_VARIABLE exitCode OUTPUT_VARIABLE output ERROR_VARIABLE errors)
set(plugin ${PREFIX}/bin/${PLUGIN_RELATIVE_DIR}/libPluginAlarmSearchSrv.so)
if(NOT exitCode EQUAL 0 OR NOT output MATCHES "^Plug-in loaded from ${plugin}\\.\n")
    message(FATAL_ERROR "installed alarmsearch demo failed (${exitCode}):\n${output}\n${errors}")
endif()

# The installed plug-in keeps the run path that finds the trace library beside it.
execute_process(COMMAND readelf -d ${plugin} OUTPUT_VARIABLE dynamic COMMAND_ERROR_IS_FATAL ANY)
if(NOT dynamic MATCHES "\\(RUNPATH\\) +Library runpath: \\[\\$ORIGIN\\]")
    message(FATAL_ERROR "installed plug-in lacks its $ORIGIN run path:\n${dynamic}")
endif()
if(NOT EXISTS ${PREFIX}/bin/${PLUGIN_RELATIVE_DIR}/libZoltLogUtl.dylib)
    message(FATAL_ERROR "no trace library beside the installed plug-in")
endif()
