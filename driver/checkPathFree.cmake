# Fails when one of the files holds one of the folders' paths: an image or PDB
# that records where it was built differs from one checkout to the next.
# Run as: cmake -DFILES=a|b -DFOLDERS=c|d -P
cmake_minimum_required(VERSION 3.22)

string(REPLACE "|" ";" files "${FILES}")
string(REPLACE "|" ";" folders "${FOLDERS}")
foreach(file ${files})
  if(NOT EXISTS "${file}")
    message(FATAL_ERROR "${file} does not exist")
  endif()
  foreach(folder ${folders})
    string(REGEX REPLACE "([][+.*()^$?|\\\\])" "\\\\\\1" pattern "${folder}")
    file(STRINGS "${file}" hits REGEX "${pattern}")
    if(hits)
      list(GET hits 0 first)
      message(SEND_ERROR "${file} holds the folder ${folder}: ${first}")
    endif()
  endforeach()
endforeach()
