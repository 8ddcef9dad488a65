# The message catalog: the source for translators, and the translations. ./dev catalog checks these.
if(Python3_FOUND)
  set(catalog_source ${PROJECT_BINARY_DIR}/share/qzseclib.msg)
  file(MAKE_DIRECTORY ${PROJECT_BINARY_DIR}/share)
  add_custom_command(OUTPUT ${catalog_source}
    COMMAND Python3::Interpreter -B ${PROJECT_SOURCE_DIR}/tools/catalog.py write > ${catalog_source}
    DEPENDS ${PROJECT_SOURCE_DIR}/tools/catalog.py ${PROJECT_SOURCE_DIR}/security/msg/qzseclib_msg.h VERBATIM)
  add_custom_target(catalog ALL DEPENDS ${catalog_source})
  install(FILES ${catalog_source} DESTINATION ${CMAKE_INSTALL_DATADIR}/${PROJECT_NAME} COMPONENT development)
endif()

# Compiles the translations for catopen. Under /usr its default search finds LANGUAGE/LC_MESSAGES for every locale
# of the language; elsewhere NLSPATH must name the folder. catgets does not convert, so locales with an older code
# set get a catalog in that code set under their own names, which are searched first.
find_program(GENCAT gencat)
find_program(ICONV iconv)

# qz_catalog(LOCALE SOURCE CODESET)
function(qz_catalog locale source codeset)
  set(folder ${PROJECT_BINARY_DIR}/share/locale/${locale}/LC_MESSAGES)
  file(MAKE_DIRECTORY ${folder})
  if(codeset STREQUAL "UTF-8")
    set(converted ${source})
  else()
    set(converted ${folder}/qzseclib.msg)
    add_custom_command(OUTPUT ${converted} DEPENDS ${source} VERBATIM
      COMMAND sed "1s/UTF-8/${codeset}/" ${source} > ${converted}.utf8
      COMMAND ${ICONV} -f UTF-8 -t ${codeset} ${converted}.utf8 > ${converted})
  endif()
  # Removed first, because gencat merges into an existing catalog.
  add_custom_command(OUTPUT ${folder}/qzseclib.cat DEPENDS ${converted} VERBATIM
    COMMAND ${CMAKE_COMMAND} -E rm -f ${folder}/qzseclib.cat
    COMMAND ${GENCAT} ${folder}/qzseclib.cat ${converted})
  set_property(GLOBAL APPEND PROPERTY qz_catalogs ${folder}/qzseclib.cat)
  install(FILES ${folder}/qzseclib.cat DESTINATION ${CMAKE_INSTALL_DATADIR}/locale/${locale}/LC_MESSAGES
    COMPONENT command)
endfunction()

if(NOT GENCAT)
  message(STATUS "gencat not found: the translations are not compiled")
  return()
endif()
qz_catalog(de ${PROJECT_SOURCE_DIR}/translations/de.msg UTF-8)
if(ICONV)
  foreach(locale IN ITEMS de_DE de_DE.ISO-8859-1)
    qz_catalog(${locale} ${PROJECT_SOURCE_DIR}/translations/de.msg ISO-8859-1)
  endforeach()
endif()
get_property(catalogs GLOBAL PROPERTY qz_catalogs)
add_custom_target(translations ALL DEPENDS ${catalogs})
