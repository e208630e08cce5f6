# The driver image imports from the kernel and the host library only, and from
# the kernel only the services kernel/ntkernel.h declares.
# Run as: cmake -DREADOBJ=... -DIMAGE=... -P
cmake_minimum_required(VERSION 3.22)

set(allowed_kernel ZwCreateKey ZwQueryValueKey ZwClose ZwCreateFile ZwReadFile ZwQueryInformationFile
  ZwSetInformationFile RtlInitUnicodeString RtlCopyUnicodeString wcschr)

execute_process(COMMAND ${READOBJ} --coff-imports ${IMAGE}
  OUTPUT_VARIABLE dump RESULT_VARIABLE result)
if(NOT result EQUAL 0)
  message(FATAL_ERROR "llvm-readobj could not read ${IMAGE}")
endif()

# Delay-load imports would show as "DelayImport {": allowed from nowhere.
string(REGEX MATCHALL "(Delay)?Import {[^}]*}" blocks "${dump}")
set(libraries)
foreach(block IN LISTS blocks)
  string(REGEX MATCH "Name: ([^\n]*)" _ "${block}")
  set(library "${CMAKE_MATCH_1}")
  list(APPEND libraries "${library}")
  string(REGEX MATCHALL "Symbol: [^\n]*" symbols "${block}")
  list(TRANSFORM symbols REPLACE "^Symbol: ([^ ]*).*" "\\1")
  if(block MATCHES "^Delay")
    message(SEND_ERROR "delay-loaded import of ${library}: ${symbols}")
  elseif(library STREQUAL "ntoskrnl.exe")
    set(foreign ${symbols})
    list(REMOVE_ITEM foreign ${allowed_kernel})
    if(foreign)
      message(SEND_ERROR "kernel services that kernel/ntkernel.h does not declare: ${foreign}")
    endif()
  elseif(library STREQUAL "karvelk.sys")
    if(NOT symbols)
      message(SEND_ERROR "nothing imported from karvelk.sys")
    endif()
  else()
    message(SEND_ERROR "import from ${library}: ${symbols}")
  endif()
endforeach()
if(NOT "ntoskrnl.exe" IN_LIST libraries OR NOT "karvelk.sys" IN_LIST libraries)
  message(FATAL_ERROR "expected imports from ntoskrnl.exe and karvelk.sys, found: ${libraries}")
endif()
