# SPDX-License-Identifier: BSD-2-Clause
#
# Run by cpack twice: when the package's files are together, and when they are
# packed.
set(root ${CPACK_TEMPORARY_DIRECTORY})

if(CPACK_PACKAGE_FILES)
  execute_process(
    COMMAND ${CMAKE_CURRENT_LIST_DIR}/pack-again ${root} ${CPACK_PACKAGE_FILES}
            ${CPACK_PACKAGE_DIRECTORY} ${CPACK_MARLIN_BUILT}
    COMMAND_ERROR_IS_FATAL ANY)
  return()
endif()

if(CPACK_MARLIN_STATIC)
  file(MAKE_DIRECTORY ${root}/usr/share/lintian/overrides)
  file(COPY_FILE ${CMAKE_CURRENT_LIST_DIR}/lintian-overrides
       ${root}/usr/share/lintian/overrides/marlin)
endif()
execute_process(
  COMMAND ${CMAKE_CURRENT_LIST_DIR}/finish-package ${root} "${CPACK_PACKAGE_CONTACT}"
  OUTPUT_VARIABLE time
  OUTPUT_STRIP_TRAILING_WHITESPACE COMMAND_ERROR_IS_FATAL ANY)
# cpack gives it to everything that it packs.
set(ENV{SOURCE_DATE_EPOCH} ${time})
