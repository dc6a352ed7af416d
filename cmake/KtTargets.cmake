# The targets of this project, made in one way: warnings, sanitizers, and the two forms of each library.

# What everything here is compiled with.
add_library(kt_options INTERFACE)
set(kt_sanitizer_noise) # a list of sanitizers has commas, which no generator expression takes
if(KT_SANITIZE)
  set(kt_sanitizer_noise -Wno-stringop-overflow -Wno-array-bounds)
endif()
target_compile_options(kt_options INTERFACE -Wall -Wextra -Wpedantic -Wconversion $<$<BOOL:${KT_WERROR}>:-Werror>)
# GCC 12 sees what can't happen in inlined code of its own standard library: uninitialised strings at -O3, and overflows
# once sanitizers stand between.
if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
  target_compile_options(kt_options INTERFACE -Wno-maybe-uninitialized
                                              ${kt_sanitizer_noise})
endif()
if(KT_SANITIZE)
  target_compile_options(kt_options INTERFACE -fsanitize=${KT_SANITIZE} -fno-omit-frame-pointer
                                              -fno-sanitize-recover=all)
  target_link_options(kt_options INTERFACE -fsanitize=${KT_SANITIZE})
endif()

# What the libraries are compiled with besides. Without exceptions, so that a thread that is cancelled inside an
# updating call leaves its locks held.
add_library(kt_library_options INTERFACE)
target_link_libraries(kt_library_options INTERFACE kt_options)
target_compile_options(kt_library_options INTERFACE $<$<COMPILE_LANGUAGE:CXX>:-fno-exceptions -fno-rtti>
                                                    -fvisibility=hidden)

# The shared libraries are optimised as a whole when they are linked: an exported call then costs a tenth less. Their
# objects hold both forms, since in the archives each file stays for itself, so that tests can put themselves between.
if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU" AND NOT KT_SANITIZE)
  set(kt_whole_library $<$<CONFIG:Release>:-flto=auto>)
  set(kt_both_forms $<$<CONFIG:Release>:-flto=auto;-ffat-lto-objects>)
endif()

# What the tests and the tool are compiled with besides. Under a sanitizer they aren't optimised: it finds the same in
# them, and the compiler takes less than half the time. Nor is their place in memory chosen at each start: with what
# sanitizers put into them that means hundreds of thousands of addresses to change, and each test is a start.
add_library(kt_program_options INTERFACE)
target_link_libraries(kt_program_options INTERFACE kt_options)
if(KT_SANITIZE)
  target_compile_options(kt_program_options INTERFACE -O0)
endif()
if(KT_SANITIZE MATCHES "address")
  target_link_options(kt_program_options INTERFACE $<$<STREQUAL:$<TARGET_PROPERTY:TYPE>,EXECUTABLE>:-no-pie>)
endif()

# kt_precompile(<target> ...): target_precompile_headers, where headers are to be precompiled. A source
# includes what it uses all the same, as it must where nothing is precompiled.
function(kt_precompile target)
  if(KT_PRECOMPILED_HEADERS)
    target_precompile_headers(${target} ${ARGN})
  endif()
endfunction()

# kt_add_library(<name> EXPORTS <version script> LINK <libraries> SOURCES ...)
#
# Makes from one set of objects the shared library lib<name>.so.1, which exports what the version script names, and the
# archive lib<name>_internal.a with nothing left out, for tests and tools.
function(kt_add_library name)
  cmake_parse_arguments(ARG "" "EXPORTS" "LINK;SOURCES" ${ARGN})

  add_library(${name}_objects OBJECT ${ARG_SOURCES})
  target_include_directories(${name}_objects PUBLIC ${PROJECT_SOURCE_DIR}/include PRIVATE ${PROJECT_SOURCE_DIR}/src)
  target_link_libraries(${name}_objects PRIVATE kt_library_options)
  target_compile_options(${name}_objects PRIVATE "${kt_both_forms}")

  add_library(${name} SHARED $<TARGET_OBJECTS:${name}_objects>)
  target_include_directories(${name} PUBLIC $<BUILD_INTERFACE:${PROJECT_SOURCE_DIR}/include>
                                            $<INSTALL_INTERFACE:${CMAKE_INSTALL_INCLUDEDIR}>)
  target_link_libraries(${name} PRIVATE $<BUILD_INTERFACE:kt_library_options> Threads::Threads)
  target_link_options(${name} PRIVATE "${kt_whole_library}" -Wl,--version-script=${ARG_EXPORTS} -Wl,--no-undefined-version)
  set_target_properties(${name} PROPERTIES VERSION ${PROJECT_VERSION} SOVERSION ${PROJECT_VERSION_MAJOR}
                                           LINK_DEPENDS ${ARG_EXPORTS}
                                           INSTALL_RPATH "$ORIGIN") # the libraries find each other under any prefix
  if(NOT KT_SANITIZE)
    target_link_options(${name} PRIVATE -Wl,--no-undefined)
  endif()

  add_library(${name}_internal STATIC $<TARGET_OBJECTS:${name}_objects>)
  target_include_directories(${name}_internal PUBLIC ${PROJECT_SOURCE_DIR}/include ${PROJECT_SOURCE_DIR}/src)
  target_link_libraries(${name}_internal PUBLIC Threads::Threads)

  foreach(dependency IN LISTS ARG_LINK)
    target_link_libraries(${name} PUBLIC ${dependency})
    target_link_libraries(${name}_internal PUBLIC ${dependency}_internal)
  endforeach()
endfunction()
