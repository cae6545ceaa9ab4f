# Runs one fuzz target for SECONDS seconds over a scratch copy of its seed corpus, so that the
# inputs it adds never land among the checked-in seeds. A crash input is kept in
# WORK_DIR/artifacts/ and fails the test.
#
#   cmake -DFUZZER=<target file> -DSEED_DIR=<seeds> -DWORK_DIR=<scratch> -DSECONDS=<n> -P RunFuzzer.cmake
foreach(var FUZZER SEED_DIR WORK_DIR SECONDS)
    if(NOT DEFINED ${var})
        message(FATAL_ERROR "${var} is not set")
    endif()
endforeach()

file(REMOVE_RECURSE ${WORK_DIR})
file(MAKE_DIRECTORY ${WORK_DIR}/corpus ${WORK_DIR}/artifacts)
# A target without seeds starts from nothing.
file(GLOB seeds ${SEED_DIR}/*)
if(seeds)
    file(COPY ${seeds} DESTINATION ${WORK_DIR}/corpus)
endif()

execute_process(
    COMMAND ${FUZZER} -max_total_time=${SECONDS} -rss_limit_mb=2048 -timeout=10
            -print_final_stats=1 -artifact_prefix=${WORK_DIR}/artifacts/ ${WORK_DIR}/corpus
    RESULT_VARIABLE result)
if(NOT result EQUAL 0)
    file(GLOB artifacts ${WORK_DIR}/artifacts/*)
    message(FATAL_ERROR "${FUZZER} failed (${result}); inputs: ${artifacts}")
endif()
