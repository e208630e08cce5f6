# The host calls into the module's objects, and the module into the host's,
# by virtual-table slot. This reads the slot order from the tables in the
# driver's own objects, as the compiler laid them out for the target's ABI,
# and compares it with the order the host uses.
# Run as: cmake -DREADOBJ=... -DOBJECT_DIR=... -P
cmake_minimum_required(VERSION 3.22)

# A table, then what its slots 0, 1, ... must name.
set(tables
  "??_7tTransferParameterUSBControl@nQVKORD100@@6B@"
  "?___CPPKRLDynamicCast@tTransferParameterUSBControl@nQVKORD100@@UEBAPEBXPEBX@Z|const dynamic cast"
  "?___CPPKRLDynamicCast@tTransferParameterUSBControl@nQVKORD100@@UEAAPEAXPEBX@Z|non-const dynamic cast"
  "??_GtTransferParameterUSBControl@nQVKORD100@@UEAAPEAXI@Z|destructor"
  "-"
  "??_7tControlStreamParameterUSB@nQVKORD100@@6B@"
  "?___CPPKRLDynamicCast@tControlStreamParameterUSB@nQVKORD100@@UEBAPEBXPEBX@Z|const dynamic cast"
  "?___CPPKRLDynamicCast@tControlStreamParameterUSB@nQVKORD100@@UEAAPEAXPEBX@Z|non-const dynamic cast"
  "??_GtControlStreamParameterUSB@nQVKORD100@@UEAAPEAXI@Z|destructor"
  "-"
  # The two callback interfaces the listener records hand the host.
  "??_7DeviceTable@@6BDeviceTableArrivalBase@@@"
  "?onDeviceEvent@DeviceTableArrivalBase@@UEAAXPEAVUsbDevice@@@Z|arrival callback"
  "-"
  "??_7DeviceTable@@6BDeviceTableRemovalBase@@@"
  "?onDeviceEvent@DeviceTableRemovalBase@@UEAAXPEAVUsbDevice@@@Z|removal callback"
  "-")

file(GLOB objects ${OBJECT_DIR}/*.obj)
if(NOT objects)
  message(FATAL_ERROR "no objects in ${OBJECT_DIR}")
endif()
set(index 0)
foreach(object ${objects})
  math(EXPR index "${index} + 1")
  execute_process(COMMAND ${READOBJ} --symbols --relocations ${object}
    OUTPUT_VARIABLE dump_${index} RESULT_VARIABLE result)
  if(NOT result EQUAL 0)
    message(FATAL_ERROR "llvm-readobj could not read ${object}")
  endif()
endforeach()

function(escape text out)
  string(REGEX REPLACE "([][+.*()^$?|\\\\])" "\\\\\\1" escaped "${text}")
  set(${out} "${escaped}" PARENT_SCOPE)
endfunction()

# The symbol each slot of the table points at, from the first object that
# holds the table; empty when none does.
function(read_slots table out)
  escape("${table}" name)
  set(index 0)
  foreach(object ${objects})
    math(EXPR index "${index} + 1")
    set(dump "${dump_${index}}")
    if(NOT dump MATCHES "Name: ${name}\n *Value: ([0-9]+)\n *Section: [^\n]* \\(([0-9]+)\\)\n")
      continue()
    endif()
    set(start ${CMAKE_MATCH_1})
    set(section ${CMAKE_MATCH_2})
    if(NOT dump MATCHES "\n *Section \\(${section}\\) [^\n]*{\n([^}]*)}")
      message(SEND_ERROR "${table} in ${object} has no relocations: its slots name nothing")
      return()
    endif()
    string(REGEX MATCHALL "0x[0-9A-F]+ IMAGE_REL_AMD64_ADDR64 [^ \n]+" entries "${CMAKE_MATCH_1}")
    foreach(entry ${entries})
      string(REGEX MATCH "^0x([0-9A-F]+) [^ ]+ (.*)$" parsed "${entry}")
      math(EXPR offset "0x${CMAKE_MATCH_1} - ${start}")
      math(EXPR slot "${offset} / 8")
      if(offset GREATER_EQUAL 0)
        set(slot_${slot} "${CMAKE_MATCH_2}")
      endif()
    endforeach()
    set(names "")
    foreach(slot RANGE 0 15)
      if(NOT DEFINED slot_${slot})
        break()
      endif()
      list(APPEND names "${slot_${slot}}")
    endforeach()
    set(${out} "${names}" PARENT_SCOPE)
    return()
  endforeach()
  set(${out} "" PARENT_SCOPE)
endfunction()

set(table "")
set(expected "")
foreach(item ${tables})
  if(table STREQUAL "")
    set(table "${item}")
  elseif(NOT item STREQUAL "-")
    list(APPEND expected "${item}")
  else()
    read_slots("${table}" actual)
    if(NOT actual)
      message(SEND_ERROR "no object holds ${table}")
    endif()
    set(slot 0)
    foreach(want ${expected})
      string(REPLACE "|" ";" want "${want}")
      list(GET want 0 symbol)
      list(GET want 1 what)
      list(LENGTH actual count)
      if(slot LESS count)
        list(GET actual ${slot} got)
      else()
        set(got "nothing")
      endif()
      if(NOT got STREQUAL symbol)
        message(SEND_ERROR "${table} slot ${slot} holds ${got}; the host expects the ${what} there (${symbol})")
      else()
        message(STATUS "${table} slot ${slot}: ${what}")
      endif()
      math(EXPR slot "${slot} + 1")
    endforeach()
    set(table "")
    set(expected "")
  endif()
endforeach()
