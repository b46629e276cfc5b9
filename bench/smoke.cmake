# Runs PROGRAM shortly, with ARGUMENTS. It must end with status 0 and print, for each of EXPRESSIONS, what matches.
execute_process(COMMAND "${PROGRAM}" --rounds 3 ${ARGUMENTS}
    OUTPUT_VARIABLE output ERROR_VARIABLE errors RESULT_VARIABLE result)
message("${output}${errors}")
if(NOT result EQUAL 0)
    message(FATAL_ERROR "${PROGRAM} ended with ${result}")
endif()
foreach(expression IN LISTS EXPRESSIONS)
    if(NOT output MATCHES "${expression}")
        message(FATAL_ERROR "nothing printed that matches: ${expression}")
    endif()
endforeach()
