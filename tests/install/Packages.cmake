# Builds the Debian packages of the build tree and checks them: each one's files (mode, owner,
# path) against expected/<package>.contents, no file carrying a path of the source or build tree,
# the unpacked alarmsearch running its demo, and no error from lintian.
#   BUILD_DIR, SOURCE_DIR, WORK_DIR, EXPECTED_DIR, PACKAGES
file(REMOVE_RECURSE ${WORK_DIR})
execute_process(COMMAND cpack -G DEB -B ${WORK_DIR} --config ${BUILD_DIR}/CPackConfig.cmake
                OUTPUT_QUIET COMMAND_ERROR_IS_FATAL ANY)

string(REGEX REPLACE "([][+.*()^$?|\\\\])" "\\\\\\1" sourcePattern ${SOURCE_DIR})
# The tree's path where a path starts, not inside a relative one (a tree at /src would match
# every "x/src/y" otherwise).
set(sourcePattern "(^|[^A-Za-z0-9_.+-])${sourcePattern}/")
set(debs)
foreach(package ${PACKAGES})
    file(GLOB deb ${WORK_DIR}/${package}_*.deb)
    list(APPEND debs ${deb})
    execute_process(COMMAND dpkg-deb -c ${deb} OUTPUT_VARIABLE listing COMMAND_ERROR_IS_FATAL ANY)
    # Mode, owner and path of everything but the folders, whose depth follows the plug-in folder.
    string(REPLACE "\n" ";" lines "${listing}")
    set(listing "")
    foreach(line IN LISTS lines)
        if(line MATCHES "^([^d][^ ]*) ([^ ]+) +[0-9]+ [0-9-]+ [0-9:]+ (.+)$")
            string(APPEND listing "${CMAKE_MATCH_1} ${CMAKE_MATCH_2} ${CMAKE_MATCH_3}\n")
        endif()
    endforeach()
    file(READ ${EXPECTED_DIR}/${package}.contents expected)
    if(NOT listing STREQUAL expected)
        message(SEND_ERROR "${package} holds:\n${listing}\nexpected:\n${expected}")
    endif()
    execute_process(COMMAND dpkg-deb -x ${deb} ${WORK_DIR}/root COMMAND_ERROR_IS_FATAL ANY)
endforeach()

file(GLOB_RECURSE files ${WORK_DIR}/root/*)
foreach(file ${files})
    file(STRINGS ${file} hits REGEX "${sourcePattern}")
    if(hits)
        message(SEND_ERROR "${file} names the source tree: ${hits}")
    endif()
endforeach()

# The packaged alarmsearch, unpacked, finds the packaged plug-in by itself.
execute_process(COMMAND env -i ${WORK_DIR}/root/usr/bin/alarmsearch demo
                RESULT_VARIABLE exitCode OUTPUT_QUIET ERROR_VARIABLE errors)
if(NOT exitCode EQUAL 0)
    message(SEND_ERROR "the packaged alarmsearch demo failed (${exitCode}): ${errors}")
endif()

execute_process(COMMAND lintian --fail-on error ${debs} RESULT_VARIABLE exitCode
                OUTPUT_VARIABLE verdict ERROR_VARIABLE verdict)
message("lintian:\n${verdict}")
if(NOT exitCode EQUAL 0)
    message(FATAL_ERROR "lintian found errors")
endif()
