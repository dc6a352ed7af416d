# Checks that each test that a document names exists: `suite.name` in backquotes, as a TEST in tests/*/*_test.cpp.
#
#   cmake -DDOCUMENT=<document> -DTESTS=<directory of the tests> -P named_tests.cmake

cmake_minimum_required(VERSION 3.25)

file(GLOB sources ${TESTS}/*/*_test.cpp)
set(existing)
foreach(source IN LISTS sources)
  file(READ ${source} text)
  string(REGEX MATCHALL "TEST(_F|_P)?\\([ \n]*[A-Za-z0-9_]+,[ \n]*[A-Za-z0-9_]+\\)" definitions "${text}")
  foreach(definition IN LISTS definitions)
    string(REGEX REPLACE "^TEST(_F|_P)?\\([ \n]*([A-Za-z0-9_]+),[ \n]*([A-Za-z0-9_]+)\\)$" "\\2.\\3" name "${definition}")
    list(APPEND existing ${name})
  endforeach()
endforeach()

file(READ ${DOCUMENT} text)
string(REGEX MATCHALL "`[a-z0-9_]+\\.[a-z0-9_]+`" named "${text}")
if(NOT named)
  message(FATAL_ERROR "${DOCUMENT} names no test")
endif()
foreach(name IN LISTS named)
  string(REPLACE "`" "" name ${name})
  if(NOT name IN_LIST existing)
    message(SEND_ERROR "no test is named ${name}")
  endif()
endforeach()
