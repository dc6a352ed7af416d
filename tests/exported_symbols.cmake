# Compares four lists of names: what the shared library exports, what its version script names, what its public headers
# declare, and what it has promised to export: one name a line. Nothing may be added or lost without that list.
#
#   cmake -DNM=<nm> -DLIBRARY=<lib.so> -DMAP=<version script> "-DHEADERS=<header>;..." -DNAMES=<list>
#         -P exported_symbols.cmake

function(read_exported_names library result)
  execute_process(COMMAND ${NM} -D --defined-only ${library} OUTPUT_VARIABLE listing COMMAND_ERROR_IS_FATAL ANY)
  string(REGEX MATCHALL "[^\n]+" lines "${listing}")
  set(names)
  foreach(line IN LISTS lines)
    string(REGEX REPLACE "^[0-9a-f]+ [A-Za-z] ([^@]+).*$" "\\1" name "${line}")
    list(APPEND names ${name})
  endforeach()
  set(${result} ${names} PARENT_SCOPE)
endfunction()

function(read_version_script map result)
  file(READ ${map} text)
  string(REGEX REPLACE "^.*global:(.*)local:.*$" "\\1" text "${text}")
  string(REGEX MATCHALL "[A-Za-z_][A-Za-z_0-9]*" names "${text}")
  set(${result} ${names} PARENT_SCOPE)
endfunction()

# Functions that return a code or nothing, and data: each declaration begins its line.
function(read_declared_names header result)
  file(READ ${header} text)
  string(REGEX REPLACE "/\\*([^*]|\\*+[^*/])*\\*+/" "" text "${text}")
  string(REGEX MATCHALL "\n(kt_int32_t|void) +[a-z_0-9]+\\(" functions "${text}")
  string(REGEX MATCHALL "\nextern [^;\"\n]+" objects "${text}")
  set(names)
  foreach(declaration IN LISTS functions objects)
    string(REGEX MATCH "([a-z_0-9]+)(\\(|\\[[^\n]*\\])?$" ignored "${declaration}")
    list(APPEND names ${CMAKE_MATCH_1})
  endforeach()
  set(${result} ${names} PARENT_SCOPE)
endfunction()

function(compare what_a a what_b b)
  list(REMOVE_ITEM a ${b})
  foreach(name IN LISTS a)
    message(SEND_ERROR "${name}: ${what_a}, but not ${what_b}")
  endforeach()
endfunction()

read_exported_names(${LIBRARY} exported)
read_version_script(${MAP} mapped)
set(declared)
foreach(header IN LISTS HEADERS)
  read_declared_names(${header} names)
  list(APPEND declared ${names})
endforeach()

file(STRINGS ${NAMES} promised)

foreach(list IN ITEMS exported mapped declared promised)
  list(LENGTH ${list} length)
  if(length EQUAL 0)
    message(FATAL_ERROR "found no ${list} names: this check would check nothing")
  endif()
endforeach()
compare("exported" "${exported}" "in the version script" "${mapped}")
compare("in the version script" "${mapped}" "exported" "${exported}")
compare("declared" "${declared}" "exported" "${exported}")
compare("exported" "${exported}" "declared" "${declared}")
compare("promised" "${promised}" "exported" "${exported}")
compare("exported" "${exported}" "promised" "${promised}")
