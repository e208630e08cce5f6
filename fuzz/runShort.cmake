# One fuzzer for a fixed number of inputs with a fixed seed, from its seed
# corpus and dictionary, so that ./test sees the same inputs every time. New
# inputs go to a scratch folder, never into the checked-in corpus; a finding
# is kept in WORK and named in the failure.
# -DFUZZER=program -DRUNS=n -DSEEDS=folder|folder -DDICTIONARY=file -DWORK=folder
string(REPLACE "|" ";" seeds "${SEEDS}")
file(REMOVE_RECURSE ${WORK})
file(MAKE_DIRECTORY ${WORK}/new)
execute_process(
  COMMAND ${FUZZER} -runs=${RUNS} -seed=1 -max_len=8192 -timeout=20 -rss_limit_mb=2048
          -dict=${DICTIONARY} -artifact_prefix=${WORK}/ -print_final_stats=1
          ${WORK}/new ${seeds}
  RESULT_VARIABLE result OUTPUT_VARIABLE output ERROR_VARIABLE output)
if(NOT result EQUAL 0)
  file(GLOB findings ${WORK}/crash-* ${WORK}/leak-* ${WORK}/timeout-* ${WORK}/oom-*)
  message(FATAL_ERROR "${output}\nfindings: ${findings}")
endif()
string(REGEX MATCH "stat::number_of_executed_units: [0-9]+" executed "${output}")
string(REGEX MATCH "DONE +cov: [0-9]+ ft: [0-9]+" coverage "${output}")
message(STATUS "${executed}, ${coverage}")
