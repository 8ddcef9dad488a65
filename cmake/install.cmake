# Installs everything but programs, libraries and headers, and configures the archives of CPack. The components are
# command (for users of the commands), library (for running services) and development.
set(QZ_ZSH_COMPLETIONS site-functions CACHE STRING
  "Folder below share/zsh for the completions: site-functions, or on Debian vendor-completions")

set(commands qzaclfck)
if(QZ_COMPANION)
  list(APPEND commands qzacl)
endif()
foreach(command IN LISTS commands)
  install(FILES completions/${command}.bash DESTINATION ${CMAKE_INSTALL_DATADIR}/bash-completion/completions
    RENAME ${command} COMPONENT command)
  install(FILES completions/_${command} DESTINATION ${CMAKE_INSTALL_DATADIR}/zsh/${QZ_ZSH_COMPLETIONS}
    COMPONENT command)
  install(FILES completions/${command}.fish DESTINATION ${CMAKE_INSTALL_DATADIR}/fish/vendor_completions.d
    COMPONENT command)
endforeach()
# The documents, with links replaced by file names: their targets may be compressed, in another package, or not
# installed.
file(GLOB documents RELATIVE ${PROJECT_SOURCE_DIR} CONFIGURE_DEPENDS docs/*.md)
foreach(document IN ITEMS README.md CHANGELOG.md SECURITY.md LISTS documents)
  set_property(DIRECTORY APPEND PROPERTY CMAKE_CONFIGURE_DEPENDS ${document})
  file(READ ${document} text)
  string(REGEX REPLACE "!?\\[([^]]*)\\]\\([^):]*\\)" "\\1" text "${text}")
  file(WRITE ${PROJECT_BINARY_DIR}/share/doc/${document} "${text}")
endforeach()
install(FILES ${PROJECT_BINARY_DIR}/share/doc/README.md ${PROJECT_BINARY_DIR}/share/doc/CHANGELOG.md
  ${PROJECT_BINARY_DIR}/share/doc/SECURITY.md DESTINATION ${CMAKE_INSTALL_DOCDIR} COMPONENT command)
install(DIRECTORY ${PROJECT_BINARY_DIR}/share/doc/docs DESTINATION ${CMAKE_INSTALL_DOCDIR} COMPONENT development)
install(DIRECTORY examples DESTINATION ${CMAKE_INSTALL_DOCDIR} COMPONENT development
  PATTERN CMakeLists.txt EXCLUDE PATTERN *.cacl EXCLUDE PATTERN __pycache__ EXCLUDE)

set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "Checker of ACL files, and the ACL library beneath it")
set(CPACK_PACKAGE_VENDOR "the maintainers of ${PROJECT_NAME}")
set(CPACK_PACKAGE_CHECKSUM SHA256)
set(CPACK_GENERATOR TGZ)
set(CPACK_SOURCE_GENERATOR TGZ)
set(CPACK_SOURCE_PACKAGE_FILE_NAME ${PROJECT_NAME}-${PROJECT_VERSION}-source)
set(CPACK_SOURCE_IGNORE_FILES ^${PROJECT_SOURCE_DIR}/build/ /\\.git/ /\\.git$ \\.cacl$ /__pycache__/)
include(CPack)
