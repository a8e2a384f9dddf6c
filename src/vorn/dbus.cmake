# D-Bus service of the thermal side (target qor_vorn_dbus, linked into qor-server).
