# Compares the dynamic symbols libtessik defines with the reviewed list, so a change to the exported
# surface (a new export, a symbol that leaked out of hidden visibility, a dropped entry point) is a
# deliberate edit of exported_symbols.txt rather than an accident.
# Inputs: -DLIBRARY=<path to libtessik.so> -DEXPECTED=<exported_symbols.txt> [-DUPDATE=ON]
execute_process(COMMAND nm -DC --defined-only ${LIBRARY} OUTPUT_VARIABLE raw RESULT_VARIABLE rc)
if(NOT rc EQUAL 0)
  message(FATAL_ERROR "nm failed on ${LIBRARY}")
endif()
string(REPLACE "\n" ";" lines "${raw}")
set(symbols "")
foreach(line IN LISTS lines)
  # "<address> <type> <name>": keep type and name, drop the address.
  if(line MATCHES "^[0-9a-f]+ ([A-Za-z]) (.+)$")
    list(APPEND symbols "${CMAKE_MATCH_1} ${CMAKE_MATCH_2}")
  endif()
endforeach()
list(REMOVE_DUPLICATES symbols)
list(SORT symbols)
list(JOIN symbols "\n" actual)
set(actual "${actual}\n")
if(UPDATE)
  file(WRITE ${EXPECTED} "${actual}")
  return()
endif()
file(READ ${EXPECTED} expected)
if(NOT actual STREQUAL expected)
  file(WRITE ${CMAKE_CURRENT_BINARY_DIR}/exported_symbols.actual.txt "${actual}")
  message(FATAL_ERROR "Exported symbols differ from ${EXPECTED}; actual list written to "
                      "${CMAKE_CURRENT_BINARY_DIR}/exported_symbols.actual.txt\n"
                      "Review the change, then refresh the list with: cmake -DLIBRARY=${LIBRARY} "
                      "-DEXPECTED=${EXPECTED} -DUPDATE=ON -P ${CMAKE_CURRENT_LIST_FILE}")
endif()
