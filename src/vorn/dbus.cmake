# D-Bus service of the thermal side: target qor_vorn_dbus, linked into qor-server only, so that
# unit tests of the thermal core can link a fake in its place.
add_library(qor_vorn_dbus INTERFACE)
