# What is installed beside programs, libraries and headers, and the archives that CPack makes. The components are
# command (what users of qzaclfck have), library (what services run with) and development.
set(QZ_ZSH_COMPLETIONS site-functions CACHE STRING
  "Folder below share/zsh for the completions: site-functions, or on Debian vendor-completions")

install(FILES completions/qzaclfck.bash DESTINATION ${CMAKE_INSTALL_DATADIR}/bash-completion/completions
  RENAME qzaclfck COMPONENT command)
install(FILES completions/_qzaclfck DESTINATION ${CMAKE_INSTALL_DATADIR}/zsh/${QZ_ZSH_COMPLETIONS} COMPONENT command)
install(FILES completions/qzaclfck.fish DESTINATION ${CMAKE_INSTALL_DATADIR}/fish/vendor_completions.d
  COMPONENT command)
install(FILES README.md CHANGELOG.md DESTINATION ${CMAKE_INSTALL_DOCDIR} COMPONENT command)
install(DIRECTORY docs DESTINATION ${CMAKE_INSTALL_DOCDIR} COMPONENT development FILES_MATCHING PATTERN *.md
  PATTERN man EXCLUDE)
install(DIRECTORY examples DESTINATION ${CMAKE_INSTALL_DOCDIR} COMPONENT development
  PATTERN CMakeLists.txt EXCLUDE PATTERN *.cacl EXCLUDE PATTERN __pycache__ EXCLUDE)
# The texts for translators.
install(FILES ${PROJECT_BINARY_DIR}/share/qzseclib.msg DESTINATION ${CMAKE_INSTALL_DATADIR}/${PROJECT_NAME}
  COMPONENT development)

set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "Checker of ACL files, and the ACL library beneath it")
set(CPACK_PACKAGE_VENDOR "the maintainers of ${PROJECT_NAME}")
set(CPACK_PACKAGE_CHECKSUM SHA256)
set(CPACK_GENERATOR TGZ)
set(CPACK_SOURCE_GENERATOR TGZ)
set(CPACK_SOURCE_PACKAGE_FILE_NAME ${PROJECT_NAME}-${PROJECT_VERSION}-source)
set(CPACK_SOURCE_IGNORE_FILES ^${PROJECT_SOURCE_DIR}/build/ /\\.git/ /\\.git$ \\.cacl$ /__pycache__/)
include(CPack)
