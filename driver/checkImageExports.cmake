# The driver image exports exactly the nine names other code calls it by, and
# the version services' decorated names spell their C++ signatures with the
# status as `long &`. The import library other drivers link against leaves out
# the two entry points only the kernel calls.
# Run as: cmake -DREADOBJ=... -DUNDNAME=... -DIMAGE=... -DIMPLIB=... -P
cmake_minimum_required(VERSION 3.22)

set(expected_signatures
  "?getCurrentVersion@nMORVANE_1_4@@YA?AVtSSVersion@@AEAJ@Z=class tSSVersion __cdecl nMORVANE_1_4::getCurrentVersion(long &)"
  "?getOldestCompatibleVersion@nMORVANE_1_4@@YA?AVtSSVersion@@AEAJ@Z=class tSSVersion __cdecl nMORVANE_1_4::getOldestCompatibleVersion(long &)"
  "?compareVersion@nMORVANE_1_4@@YAXAEBVtSSVersion@@0AEAJPEBD@Z=void __cdecl nMORVANE_1_4::compareVersion(class tSSVersion const &, class tSSVersion const &, long &, char const *)"
  "?compareFirmwareVersion@nMORVANE_1_2@@YAXVtSSVersion@@GAEAJ@Z=void __cdecl nMORVANE_1_2::compareFirmwareVersion(class tSSVersion, unsigned short, long &)")
set(expected_names DllInitialize DllUnload pkgSetWDMWrapperLoadStateAndGetGUID pkgWDMWrapperCallSSMain
  pkgSetLegacyWrapperLoadState)
foreach(pair IN LISTS expected_signatures)
  string(REGEX REPLACE "=.*" "" name "${pair}")
  list(APPEND expected_names "${name}")
endforeach()

execute_process(COMMAND ${READOBJ} --coff-exports ${IMAGE}
  OUTPUT_VARIABLE dump RESULT_VARIABLE result)
if(NOT result EQUAL 0)
  message(FATAL_ERROR "llvm-readobj could not read ${IMAGE}")
endif()

# One entry per slot of the export address table. lld leaves slot 0 empty
# (no name, address 0); an address without a name would be an export by
# ordinal only, which nobody should be calling.
string(REGEX MATCHALL "Name: [^\n]*\n *RVA: 0x[0-9A-Fa-f]+" entries "${dump}")
set(exported)
foreach(entry IN LISTS entries)
  string(REGEX MATCH "Name: ([^\n]*)\n *RVA: (0x[0-9A-Fa-f]+)" _ "${entry}")
  set(name "${CMAKE_MATCH_1}")
  set(address "${CMAKE_MATCH_2}")
  if(name STREQUAL "")
    if(NOT address STREQUAL "0x0")
      message(SEND_ERROR "an export by ordinal only, at ${address}")
    endif()
    continue()
  endif()
  list(APPEND exported "${name}")
endforeach()

set(missing ${expected_names})
list(REMOVE_ITEM missing ${exported})
set(unexpected ${exported})
list(REMOVE_ITEM unexpected ${expected_names})
list(LENGTH exported count)
if(missing OR unexpected OR NOT count EQUAL 9)
  message(FATAL_ERROR "exports differ\n missing: ${missing}\n unexpected: ${unexpected}\n all ${count}: ${exported}")
endif()

foreach(pair IN LISTS expected_signatures)
  string(REGEX REPLACE "=.*" "" name "${pair}")
  string(REGEX REPLACE "^[^=]*=" "" signature "${pair}")
  execute_process(COMMAND ${UNDNAME} "${name}" OUTPUT_VARIABLE demangled RESULT_VARIABLE result)
  # llvm-undname echoes the name, then gives its reading on the next line.
  string(STRIP "${demangled}" demangled)
  string(REGEX REPLACE "^[^\n]*\n" "" demangled "${demangled}")
  if(NOT result EQUAL 0 OR NOT demangled STREQUAL signature)
    message(SEND_ERROR "${name}\n reads as: ${demangled}\n expected: ${signature}")
  endif()
endforeach()

execute_process(COMMAND ${READOBJ} ${IMPLIB} OUTPUT_VARIABLE library RESULT_VARIABLE result)
if(NOT result EQUAL 0)
  message(FATAL_ERROR "llvm-readobj could not read ${IMPLIB}")
endif()
foreach(name DllInitialize DllUnload)
  if(library MATCHES "Symbol: (__imp_)?${name}\n")
    message(SEND_ERROR "the import library offers ${name}, which only the kernel may call")
  endif()
endforeach()
if(NOT library MATCHES "Symbol: pkgWDMWrapperCallSSMain\n")
  message(SEND_ERROR "the import library lacks the exports other code links against")
endif()
