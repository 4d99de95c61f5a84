# Run by cpack between installing and packing: gives the files the places and forms that Debian wants.
set(root ${CPACK_TEMPORARY_INSTALL_DIRECTORY})
set(share ${root}/usr/share)
set(doc ${share}/doc/tarvelctl)

function(run)
  execute_process(COMMAND ${ARGN} COMMAND_ERROR_IS_FATAL ANY)
endfunction()

# The machine-readable copyright file ends with the licence, each line indented, blank ones marked by a point.
file(READ ${doc}/LICENSE license)
string(REGEX REPLACE "^[^\n]*\n\n[^\n]*\n" "" license "${license}")
string(REGEX REPLACE "\n\n" "\n.\n" license "${license}")
string(REGEX REPLACE "\n([^\n])" "\n \\1" license "${license}")
string(STRIP "${license}" license)
configure_file(${CMAKE_CURRENT_LIST_DIR}/copyright.in ${doc}/copyright @ONLY)
file(REMOVE ${doc}/LICENSE)

file(STRINGS ${CMAKE_CURRENT_LIST_DIR}/changelog newest LIMIT_COUNT 1)
if(NOT newest MATCHES "\\(${CPACK_PACKAGE_VERSION}-[0-9]+\\)")
  message(FATAL_ERROR "packaging/changelog does not begin with version ${CPACK_PACKAGE_VERSION}: ${newest}")
endif()
configure_file(${CMAKE_CURRENT_LIST_DIR}/changelog ${doc}/changelog.Debian COPYONLY)

file(RENAME ${share}/zsh/site-functions ${share}/zsh/vendor-completions)
file(GLOB pages ${share}/man/man*/*)
run(gzip -9nf ${pages} ${doc}/changelog.Debian)

run(find ${share} -type f -exec chmod 644 {} +)
if(DEFINED ENV{SOURCE_DATE_EPOCH})
  run(find ${root} -exec touch -hd @$ENV{SOURCE_DATE_EPOCH} {} +)
endif()
