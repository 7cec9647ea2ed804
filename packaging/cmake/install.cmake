# SPDX-License-Identifier: BSD-2-Clause
#
# What a device gets; docs/decisions.md says why the program is in libexec.
include(GNUInstallDirs)

install(TARGETS marlin RUNTIME DESTINATION ${CMAKE_INSTALL_LIBEXECDIR})
install(FILES docs/marlin.8 DESTINATION ${CMAKE_INSTALL_MANDIR}/man8)
if(TARGET marlin-install)
  install(TARGETS marlin-mend RUNTIME DESTINATION ${CMAKE_INSTALL_LIBEXECDIR})
  install(TARGETS marlin-install RUNTIME DESTINATION ${CMAKE_INSTALL_SBINDIR})
endif()
if(TARGET marlin-status)
  install(TARGETS marlin-status RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR})
  install(FILES docs/marlin-status.schema.json
          DESTINATION ${CMAKE_INSTALL_DATADIR}/marlin)
endif()
foreach(command marlin-install marlin-mend marlin-status)
  if(TARGET ${command})
    install(FILES docs/${command}.8 DESTINATION ${CMAKE_INSTALL_MANDIR}/man8)
    install(FILES packaging/completion RENAME ${command}
            DESTINATION ${CMAKE_INSTALL_DATADIR}/bash-completion/completions)
  endif()
endforeach()
install(FILES docs/marlin-layout.5 DESTINATION ${CMAKE_INSTALL_MANDIR}/man5)

if(MARLIN_UNIT_DIR)
  # The root that the unit shows marlin: places to mount what it sees, and what
  # others may want to mount. Not even the owner may write where only "run" and
  # the like are.
  set(MARLIN_ROOT ${CMAKE_INSTALL_PREFIX}/lib/marlin)
  if(NOT MARLIN_STATIC)
    # And the call by which libraries are loaded.
    string(CONCAT MARLIN_LIBRARIES "BindReadOnlyPaths=-/lib -/lib64 -/usr/lib\n"
                                   "SystemCallFilter=pread64\n")
    install(DIRECTORY DESTINATION lib/marlin/lib)
    install(DIRECTORY DESTINATION lib/marlin/lib64)
    install(DIRECTORY DESTINATION lib/marlin/usr/lib)
  endif()
  foreach(place usr/share/icu usr/share/zoneinfo.default var/db)
    install(DIRECTORY DESTINATION lib/marlin/${place})
  endforeach()
  # Files too, which drop-ins with ProtectHostname and PrivateDevices expect.
  file(CONFIGURE OUTPUT packaging/empty CONTENT "")
  foreach(file usr/libexec/marlin usr/libexec/marlin-mend proc/sys/kernel/domainname
               proc/sys/kernel/hostname run/systemd/journal/dev-log
               run/systemd/journal/socket run/systemd/journal/stdout)
    get_filename_component(directory ${file} DIRECTORY)
    get_filename_component(name ${file} NAME)
    install(FILES ${PROJECT_BINARY_DIR}/packaging/empty
            DESTINATION lib/marlin/${directory} RENAME ${name} PERMISSIONS OWNER_READ)
  endforeach()
  foreach(place dev/mqueue dev etc home proc/sys/kernel proc/sys proc root
                run/host/.os-release-stage run/host run/systemd/incoming
                run/systemd/journal run/systemd run/user run sys/fs/cgroup sys/fs sys
                tmp var/tmp)
    install(DIRECTORY DESTINATION lib/marlin/${place}
            DIRECTORY_PERMISSIONS OWNER_READ OWNER_EXECUTE)
  endforeach()
  # As systemd 257 makes it itself where a drop-in has MountAPIVFS.
  file(CREATE_LINK .os-release-stage/os-release ${PROJECT_BINARY_DIR}/packaging/os-release
       SYMBOLIC)
  install(FILES ${PROJECT_BINARY_DIR}/packaging/os-release
          DESTINATION lib/marlin/run/host)
  configure_file(packaging/marlin.service.in packaging/marlin.service @ONLY)
  install(FILES ${PROJECT_BINARY_DIR}/packaging/marlin.service
          DESTINATION ${MARLIN_UNIT_DIR})
  set(wants ${PROJECT_BINARY_DIR}/packaging/sysinit.target.wants)
  file(MAKE_DIRECTORY ${wants})
  file(CREATE_LINK ../marlin.service ${wants}/marlin.service SYMBOLIC)
  install(FILES ${wants}/marlin.service
          DESTINATION ${MARLIN_UNIT_DIR}/sysinit.target.wants)
endif()
if(MARLIN_TMPFILES_DIR)
  install(FILES packaging/marlin.conf DESTINATION ${MARLIN_TMPFILES_DIR})
endif()

install(FILES README.md CHANGELOG.md LICENSE SECURITY.md
        DESTINATION ${CMAKE_INSTALL_DOCDIR})
install(FILES docs/architecture.md docs/decisions.md docs/integration.md
              docs/proofs.md docs/readers.md docs/demo.svg
        DESTINATION ${CMAKE_INSTALL_DOCDIR}/docs)
install(DIRECTORY packaging/examples DESTINATION ${CMAKE_INSTALL_DOCDIR}
        USE_SOURCE_PERMISSIONS)
