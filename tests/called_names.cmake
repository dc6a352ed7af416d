# Checks that each name of a list is used by some test: a function is called, or its address taken; data is looked at.
# The table of calls that are made with a NULL handle doesn't count.
#
#   cmake -DNAMES=<list> -DTESTS=<directory of the tests> -P called_names.cmake

cmake_minimum_required(VERSION 3.25)

file(GLOB_RECURSE sources ${TESTS}/*.cpp ${TESTS}/*.h)
list(FILTER sources EXCLUDE REGEX "/frame/exported_calls\\.h$")
set(text)
foreach(source IN LISTS sources)
  file(READ ${source} content)
  string(REGEX REPLACE "//[^\n]*" "" content "${content}")
  string(APPEND text "${content}\n")
endforeach()

file(STRINGS ${NAMES} names)
if(NOT names)
  message(FATAL_ERROR "${NAMES} lists no name: this check would check nothing")
endif()
foreach(name IN LISTS names)
  if(name MATCHES "^rg_")
    set(use "[^A-Za-z0-9_\"]${name}[ \n]*[(,;)}]")
  else()
    set(use "[^A-Za-z0-9_]${name}[^A-Za-z0-9_]")
  endif()
  if(NOT text MATCHES "${use}")
    message(SEND_ERROR "no test uses ${name}")
  endif()
endforeach()
