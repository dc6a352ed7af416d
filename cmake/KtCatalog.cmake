# The message catalog, share/kt_rg.cat in the build tree, and its source kt_rg.msg beside it.
#
# The catalog is installed as share/locale/en/LC_MESSAGES/kt_rg.cat: with the prefix /usr that is where catopen looks by
# itself in an English locale; with any other, set NLSPATH=<prefix>/share/locale/%l/LC_MESSAGES/%N. A translation is made
# from share/kt_rg/kt_rg.msg with gencat, and goes to the same place under its own language. In the locale C, and where
# there is no catalog, the library's built-in texts stand, which are the same.
find_program(KT_GENCAT gencat REQUIRED)

add_executable(kt_rg_catalog_source ${PROJECT_SOURCE_DIR}/tools/catalog/kt_rg_catalog.cpp)
target_include_directories(kt_rg_catalog_source PRIVATE ${PROJECT_SOURCE_DIR}/include ${PROJECT_SOURCE_DIR}/src)
target_link_libraries(kt_rg_catalog_source PRIVATE kt_options)

set(KT_CATALOG ${CMAKE_BINARY_DIR}/share/kt_rg.cat)
file(MAKE_DIRECTORY ${CMAKE_BINARY_DIR}/share)
add_custom_command(
  OUTPUT ${KT_CATALOG} ${CMAKE_BINARY_DIR}/share/kt_rg.msg
  COMMAND kt_rg_catalog_source > ${CMAKE_BINARY_DIR}/share/kt_rg.msg
  COMMAND ${CMAKE_COMMAND} -E rm -f ${KT_CATALOG} # gencat would merge into what is there
  COMMAND ${KT_GENCAT} ${KT_CATALOG} ${CMAKE_BINARY_DIR}/share/kt_rg.msg
  DEPENDS kt_rg_catalog_source
  COMMENT "Making the message catalog share/kt_rg.cat"
  VERBATIM)
add_custom_target(kt_rg_catalog ALL DEPENDS ${KT_CATALOG})

install(FILES ${KT_CATALOG} DESTINATION ${CMAKE_INSTALL_LOCALEDIR}/en/LC_MESSAGES)
install(FILES ${CMAKE_BINARY_DIR}/share/kt_rg.msg DESTINATION ${CMAKE_INSTALL_DATADIR}/kt_rg)
