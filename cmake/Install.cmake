# What is installed, and the Debian packages: the agent with its command line, a stand-in for the coverage service, the
# client library for running other programs, and what it takes to build them.
set(KVR_LIBEXEC ${CMAKE_INSTALL_LIBEXECDIR}/kvragent)
set(KVR_AGENT ${CMAKE_INSTALL_FULL_LIBEXECDIR}/kvragent/kvragent)
configure_file(dbus/com.tarsil.kvragent.service.in com.tarsil.kvragent.service @ONLY)
configure_file(systemd/kvragent.service.in kvragent.service @ONLY)
configure_file(cmake/kvragent-client.pc.in kvragent-client.pc @ONLY)

set(CMAKE_INSTALL_DEFAULT_COMPONENT_NAME agent)
# The agent looks for the libraries that it loads at first use, and for kvragent-wake, in its own directory.
install(TARGETS kvragent kvragent-wake RUNTIME DESTINATION ${KVR_LIBEXEC})
install(TARGETS kvragent-http kvragent-locale LIBRARY DESTINATION ${KVR_LIBEXEC})
install(TARGETS kvrctl RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR})
install(DIRECTORY resources/ DESTINATION ${CMAKE_INSTALL_DATADIR}/kvragent/Resources)
install(FILES ${PROJECT_BINARY_DIR}/com.tarsil.kvragent.service
        DESTINATION ${CMAKE_INSTALL_DATADIR}/dbus-1/services)
install(FILES dbus/com.tarsil.kvragent.KVRAgentProtocol.xml DESTINATION ${CMAKE_INSTALL_DATADIR}/dbus-1/interfaces)
install(FILES ${PROJECT_BINARY_DIR}/kvragent.service DESTINATION lib/systemd/user)
install(FILES docs/man/kvrctl.1 DESTINATION ${CMAKE_INSTALL_MANDIR}/man1)
install(FILES docs/man/kvragent-device.5 DESTINATION ${CMAKE_INSTALL_MANDIR}/man5)
install(FILES docs/man/kvragent.8 DESTINATION ${CMAKE_INSTALL_MANDIR}/man8)
install(FILES completion/kvrctl.bash DESTINATION ${CMAKE_INSTALL_DATADIR}/bash-completion/completions RENAME kvrctl)
install(FILES completion/_kvrctl DESTINATION ${CMAKE_INSTALL_DATADIR}/zsh/vendor-completions)
# With permissions of their own, since the agent ignores a device that others may write.
install(DIRECTORY examples/client examples/device DESTINATION ${CMAKE_INSTALL_DOCDIR}/examples)
install(PROGRAMS examples/coverage.py DESTINATION ${CMAKE_INSTALL_DOCDIR}/examples)
install(PROGRAMS examples/service/start DESTINATION ${CMAKE_INSTALL_DOCDIR}/examples/service)

set(CMAKE_INSTALL_DEFAULT_COMPONENT_NAME service)
install(TARGETS kvr-coverage-service RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR})

set(CMAKE_INSTALL_DEFAULT_COMPONENT_NAME development)
install(TARGETS kvragent-client EXPORT kvragent-client LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR}
        COMPONENT client NAMELINK_COMPONENT development)
foreach(header client/AgentClient client/AgentConnection client/LocalState client/Records platform/value/Date
        platform/value/Error platform/value/Value)
  get_filename_component(folder ${header} DIRECTORY)
  install(FILES src/${header}.h DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/kvragent/${folder})
endforeach()
include(CMakePackageConfigHelpers)
write_basic_package_version_file(kvragent-clientConfigVersion.cmake COMPATIBILITY SameMinorVersion)
set(KVR_PACKAGE ${CMAKE_INSTALL_LIBDIR}/cmake/kvragent-client)
install(EXPORT kvragent-client NAMESPACE kvragent:: DESTINATION ${KVR_PACKAGE} FILE kvragent-clientConfig.cmake)
install(FILES ${PROJECT_BINARY_DIR}/kvragent-clientConfigVersion.cmake DESTINATION ${KVR_PACKAGE})
install(FILES ${PROJECT_BINARY_DIR}/kvragent-client.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)

set(CPACK_GENERATOR DEB)
set(CPACK_PACKAGE_NAME kvragent)
set(CPACK_PACKAGE_CONTACT "The kvragent developers <kvragent@example.org>")
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_STRIP_FILES ON)
set(CPACK_COMPONENTS_ALL agent service client development)
set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
# What else is linked with the client library depends on its package; the agent's modules are nobody's libraries.
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS_POLICY ">=")
set(summary "warranty and coverage agent of a device")

set(CPACK_DEBIAN_AGENT_PACKAGE_NAME kvragent)
set(CPACK_COMPONENT_AGENT_DESCRIPTION "${summary}")
set(CPACK_DEBIAN_AGENT_PACKAGE_SECTION utils)
set(CPACK_DEBIAN_AGENT_PACKAGE_DEPENDS "default-dbus-session-bus | dbus-session-bus | dbus")
set(CPACK_DEBIAN_AGENT_PACKAGE_RECOMMENDS "ca-certificates")
set(CPACK_DEBIAN_AGENT_PACKAGE_SUGGESTS "kvr-coverage-service")

set(CPACK_DEBIAN_SERVICE_PACKAGE_NAME kvr-coverage-service)
set(CPACK_COMPONENT_SERVICE_DESCRIPTION "${summary} (stand-in for its service)")
set(CPACK_DEBIAN_SERVICE_PACKAGE_SECTION utils)
set(CPACK_DEBIAN_SERVICE_PACKAGE_RECOMMENDS "kvragent")

set(CPACK_DEBIAN_CLIENT_PACKAGE_NAME libkvragent-client0)
set(CPACK_COMPONENT_CLIENT_DESCRIPTION "${summary} (client library)")
set(CPACK_DEBIAN_CLIENT_PACKAGE_SECTION libs)
set(CPACK_DEBIAN_CLIENT_PACKAGE_RECOMMENDS "kvragent")

set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_NAME libkvragent-client-dev)
set(CPACK_COMPONENT_DEVELOPMENT_DESCRIPTION "${summary} (for building clients)")
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_SECTION libdevel)
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_DEPENDS "libkvragent-client0 (= ${PROJECT_VERSION})")
include(CPack)
