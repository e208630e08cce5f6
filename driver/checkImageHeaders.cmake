# What the kernel's loader expects of a driver image: x64, native subsystem,
# relocatable (it is never loaded at its preferred base), unwind data for
# every function (the kernel unwinds through it), and no thread-local storage,
# which the kernel does not provide. The checksum has a test of its own.
# Run as: cmake -DREADOBJ=... -DIMAGE=... -P
cmake_minimum_required(VERSION 3.22)

execute_process(COMMAND ${READOBJ} --file-headers ${IMAGE}
  OUTPUT_VARIABLE dump RESULT_VARIABLE result)
if(NOT result EQUAL 0)
  message(FATAL_ERROR "llvm-readobj could not read ${IMAGE}")
endif()

function(header_value field out)
  if(NOT dump MATCHES "\n *${field}: ([^\n]*)")
    message(FATAL_ERROR "no ${field} in the image headers")
  endif()
  set(${out} "${CMAKE_MATCH_1}" PARENT_SCOPE)
endfunction()

function(expect field pattern)
  header_value(${field} value)
  if(NOT value MATCHES "${pattern}")
    message(SEND_ERROR "${field} is ${value}, expected ${pattern}")
  endif()
endfunction()

expect(Machine "^IMAGE_FILE_MACHINE_AMD64 ")
expect(Subsystem "^IMAGE_SUBSYSTEM_NATIVE ")
expect(BaseRelocationTableRVA "^0x[1-9A-F]")
expect(BaseRelocationTableSize "^0x[1-9A-F]")
expect(ExceptionTableRVA "^0x[1-9A-F]")
expect(ExceptionTableSize "^0x[1-9A-F]")
expect(TLSTableSize "^0x0$")
if(dump MATCHES "IMAGE_FILE_RELOCS_STRIPPED")
  message(SEND_ERROR "the image has its relocations stripped")
endif()
# A user-mode flag; it means nothing for a driver.
if(dump MATCHES "IMAGE_DLL_CHARACTERISTICS_TERMINAL_SERVER_AWARE")
  message(SEND_ERROR "the image claims to be Terminal Server aware")
endif()
if(dump MATCHES "IMAGE_DLL_CHARACTERISTICS_NO_SEH")
  message(SEND_ERROR "the image claims to have no exception handling data")
endif()
