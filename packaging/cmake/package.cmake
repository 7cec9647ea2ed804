# SPDX-License-Identifier: BSD-2-Clause
#
# The Debian package: "cpack" in a build directory makes it. Two builds of one
# commit give the same bytes, wherever and whenever they are made.
set(CPACK_GENERATOR DEB)
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_STRIP_FILES ON)
set(CPACK_PACKAGE_CONTACT "${MARLIN_PACKAGE_CONTACT}")
set(CPACK_INSTALL_DEFAULT_DIRECTORY_PERMISSIONS
    OWNER_READ OWNER_WRITE OWNER_EXECUTE GROUP_READ GROUP_EXECUTE WORLD_READ
    WORLD_EXECUTE)

# The system's name for the processor; a cross build has no dpkg to ask.
set(architecture_x86_64 amd64)
set(architecture_aarch64 arm64)
set(architecture_arm armhf)
set(CPACK_DEBIAN_PACKAGE_ARCHITECTURE
    ${architecture_${CMAKE_SYSTEM_PROCESSOR}})
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_SECTION admin)
set(CPACK_DEBIAN_PACKAGE_PRIORITY optional)
set(CPACK_DEBIAN_PACKAGE_DESCRIPTION
    "Runs once at every boot, before anything reads the local time. Keeps the links
below /var/db/timezone pointing at the newest time-zone data that fits the
system: that of the system partition, or an update downloaded since. Falls
back to the system partition when an update is missing, cannot be read, is too
old or was made for another system.")
if(NOT MARLIN_STATIC)
  set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
endif()

# Debian's own files, and the one time that every file in the package has.
set(CPACK_PRE_BUILD_SCRIPTS ${PROJECT_SOURCE_DIR}/packaging/finish-package.cmake)
set(CPACK_POST_BUILD_SCRIPTS ${CPACK_PRE_BUILD_SCRIPTS})
set(CPACK_MARLIN_STATIC ${MARLIN_STATIC})
set(CPACK_MARLIN_BUILT ${PROJECT_BINARY_DIR} ${CMAKE_CXX_COMPILER} ${CMAKE_OBJCOPY})

include(CPack)
