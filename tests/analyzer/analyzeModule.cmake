# Runs clang's static analyzer over each of the module's sources with the
# flags of one target and fails on any finding, listing every one.
# -DCLANG=clang++ -DFLAGS=a|b|c -DSOURCES=x.cpp|y.cpp
string(REPLACE "|" ";" flags "${FLAGS}")
string(REPLACE "|" ";" sources "${SOURCES}")
set(findings "")
set(count 0)
foreach(source ${sources})
  execute_process(
    COMMAND ${CLANG} --analyze -Xclang -analyzer-output=text ${flags} -o /dev/null ${source}
    RESULT_VARIABLE result OUTPUT_VARIABLE output ERROR_VARIABLE output)
  math(EXPR count "${count} + 1")
  if(NOT result EQUAL 0 OR output MATCHES "(warning|error):")
    string(APPEND findings "${output}")
  endif()
endforeach()
if(findings)
  message(FATAL_ERROR "${findings}")
endif()
message(STATUS "${count} sources analysed, no findings")
