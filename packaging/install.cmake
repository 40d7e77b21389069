# Runs at `cmake --install`, with the folders `packaging` and `work` and with `bundle`, the service's folder below the
# prefix: installs the files by which the bus, systemd and logrotate find the service, with the prefix that holds then.
# They look in fixed places. Below the prefix /usr those are the ones of packages; for any other prefix they are the
# machine's own, which come before those.
set(program ${CMAKE_INSTALL_PREFIX}/${bundle}/VeltraOrloServices)
if(CMAKE_INSTALL_PREFIX STREQUAL "/usr")
    set(policies /usr/share/dbus-1/system.d)
    set(activations /usr/share/dbus-1/system-services)
    set(units /usr/lib/systemd/system)
    set(tmpfiles /usr/lib/tmpfiles.d)
else()
    set(policies /etc/dbus-1/system.d)
    set(activations /usr/local/share/dbus-1/system-services)
    set(units /etc/systemd/system)
    set(tmpfiles /etc/tmpfiles.d)
endif()
configure_file(${packaging}/com.tevari.VeltraOrloServices.service.in ${work}/com.tevari.VeltraOrloServices.service @ONLY)
configure_file(${packaging}/veltra-orlo-services.service.in ${work}/veltra-orlo-services.service @ONLY)

file(INSTALL ${packaging}/com.tevari.VeltraOrloServices.conf DESTINATION ${policies})
file(INSTALL ${work}/com.tevari.VeltraOrloServices.service DESTINATION ${activations})
file(INSTALL ${work}/veltra-orlo-services.service DESTINATION ${units})
file(INSTALL ${packaging}/veltra-orlo-services.tmpfiles DESTINATION ${tmpfiles} RENAME veltra-orlo-services.conf)
file(INSTALL ${packaging}/veltra-orlo-services.logrotate DESTINATION /etc/logrotate.d RENAME veltra-orlo-services)
