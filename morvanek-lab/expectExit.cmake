# Runs the lab with ARGUMENTS and checks its exit code and that its output
# (standard output and error together) matches PATTERN.
string(REPLACE "|" ";" arguments "${ARGUMENTS}")
execute_process(COMMAND ${LAB} ${arguments} RESULT_VARIABLE code OUTPUT_VARIABLE out ERROR_VARIABLE err)
set(all "${out}${err}")
if(NOT code EQUAL EXPECTED_EXIT)
  message(FATAL_ERROR "exit code ${code}, expected ${EXPECTED_EXIT}; output:\n${all}")
endif()
if(NOT all MATCHES "${PATTERN}")
  message(FATAL_ERROR "the output does not match \"${PATTERN}\":\n${all}")
endif()
message(STATUS "exit ${code} as expected; output:\n${all}")
