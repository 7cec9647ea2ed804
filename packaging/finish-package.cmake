# SPDX-License-Identifier: BSD-2-Clause
#
# Run by cpack when the package's files are together and not yet packed.
execute_process(
  COMMAND
    ${CPACK_MARLIN_SOURCE_DIR}/packaging/finish-package
    --contact "${CPACK_PACKAGE_CONTACT}"
    --static ${CPACK_MARLIN_STATIC} ${CPACK_TEMPORARY_DIRECTORY}
  OUTPUT_VARIABLE time
  OUTPUT_STRIP_TRAILING_WHITESPACE COMMAND_ERROR_IS_FATAL ANY)
# So that the package's own members get this time too.
set(ENV{SOURCE_DATE_EPOCH} ${time})
