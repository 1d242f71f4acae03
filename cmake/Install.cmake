# Where the programs go: where the units of systemd and the services of the bus start them, and where the programs that
# start each other look. Below CMAKE_INSTALL_PREFIX, which for a system is /usr.
include(GNUInstallDirs)
install(TARGETS typhond typhon-relayd DESTINATION ${CMAKE_INSTALL_SBINDIR})
install(TARGETS typhonctl typhon-agent DESTINATION ${CMAKE_INSTALL_BINDIR})
install(TARGETS typhon-fontmanagerd typhon-font-parser typhon-asset-downloader
    DESTINATION ${CMAKE_INSTALL_LIBEXECDIR}/typhon)

file(GLOB units CONFIGURE_DEPENDS packaging/systemd/*.service packaging/systemd/*.socket)
install(FILES ${units} DESTINATION lib/systemd/system)
file(GLOB bus_services CONFIGURE_DEPENDS packaging/dbus/*.service)
install(FILES ${bus_services} DESTINATION ${CMAKE_INSTALL_DATADIR}/dbus-1/system-services)
file(GLOB bus_policies CONFIGURE_DEPENDS packaging/dbus/*.conf)
install(FILES ${bus_policies} DESTINATION ${CMAKE_INSTALL_DATADIR}/dbus-1/system.d)
install(FILES packaging/systemd/typhon.sysusers DESTINATION lib/sysusers.d RENAME typhon.conf)
install(FILES packaging/systemd/typhon.tmpfiles DESTINATION lib/tmpfiles.d RENAME typhon.conf)
file(GLOB autostarted CONFIGURE_DEPENDS packaging/autostart/*.desktop)
install(FILES ${autostarted} DESTINATION ${CMAKE_INSTALL_SYSCONFDIR}/xdg/autostart)
file(GLOB activities CONFIGURE_DEPENDS packaging/activities/*.plist)
install(FILES ${activities} DESTINATION ${CMAKE_INSTALL_SYSCONFDIR}/typhon/activities.d)
file(GLOB notifications CONFIGURE_DEPENDS packaging/notifications/*.plist)
install(FILES ${notifications} DESTINATION ${CMAKE_INSTALL_SYSCONFDIR}/typhon/notifications.d)
