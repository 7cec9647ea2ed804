# SPDX-License-Identifier: BSD-2-Clause
#
# Run by cpack twice: when the package's files are together, and when they are
# packed.
set(root ${CPACK_TEMPORARY_DIRECTORY})

if(CPACK_PACKAGE_FILES)
  # Packed once more: the archive's members have the modes of cpack's umask.
  file(REMOVE ${CPACK_PACKAGE_FILES})
  execute_process(
    COMMAND ar rcD ${CPACK_PACKAGE_FILES} debian-binary control.tar.gz data.tar.gz
    WORKING_DIRECTORY ${root} COMMAND_ERROR_IS_FATAL ANY)
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
