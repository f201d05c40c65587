# What an installation holds, and the Debian package of it.
if(CMAKE_INSTALL_PREFIX_INITIALIZED_TO_DEFAULT)
  # Where the buses and service managers of Debian look.
  set(CMAKE_INSTALL_PREFIX /usr CACHE PATH "Where it is installed" FORCE)
endif()
include(GNUInstallDirs)

set(KVR_LIBEXEC ${CMAKE_INSTALL_LIBEXECDIR}/kvragent)
set(KVR_AGENT ${CMAKE_INSTALL_FULL_LIBEXECDIR}/kvragent/kvragent)
configure_file(dbus/com.tarsil.kvragent.service.in com.tarsil.kvragent.service @ONLY)
configure_file(systemd/kvragent.service.in kvragent.service @ONLY)

# The parts that the agent loads at first use, and the waker, stand beside it.
install(TARGETS kvragent kvragent-wake RUNTIME DESTINATION ${KVR_LIBEXEC})
install(TARGETS kvragent-http kvragent-locale LIBRARY DESTINATION ${KVR_LIBEXEC})
install(TARGETS kvrctl RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR})
install(DIRECTORY resources/ DESTINATION ${CMAKE_INSTALL_DATADIR}/kvragent/Resources)
install(FILES ${PROJECT_BINARY_DIR}/com.tarsil.kvragent.service
        DESTINATION ${CMAKE_INSTALL_DATADIR}/dbus-1/services)
install(FILES ${PROJECT_BINARY_DIR}/kvragent.service DESTINATION lib/systemd/user)
install(FILES docs/man/kvrctl.1 DESTINATION ${CMAKE_INSTALL_MANDIR}/man1)
install(FILES docs/man/kvragent-device.5 DESTINATION ${CMAKE_INSTALL_MANDIR}/man5)
install(FILES docs/man/kvragent.8 DESTINATION ${CMAKE_INSTALL_MANDIR}/man8)
install(FILES completion/kvrctl.bash DESTINATION ${CMAKE_INSTALL_DATADIR}/bash-completion/completions RENAME kvrctl)
install(FILES completion/_kvrctl DESTINATION ${CMAKE_INSTALL_DATADIR}/zsh/vendor-completions)
install(DIRECTORY examples DESTINATION ${CMAKE_INSTALL_DOCDIR})

set(CPACK_GENERATOR DEB)
set(CPACK_PACKAGE_NAME kvragent)
set(CPACK_PACKAGE_CONTACT "The kvragent developers <kvragent@example.org>")
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "warranty and coverage agent of a device")
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_STRIP_FILES ON)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_SECTION utils)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
set(CPACK_DEBIAN_PACKAGE_DEPENDS "default-dbus-session-bus | dbus-session-bus | dbus")
set(CPACK_DEBIAN_PACKAGE_RECOMMENDS "ca-certificates")
include(CPack)
