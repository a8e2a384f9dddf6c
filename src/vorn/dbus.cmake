# D-Bus service of the thermal side: target qor_vorn_dbus, linked into qor-server only, so that
# unit tests of the thermal core can link a fake in its place.
add_library(qor_vorn_dbus STATIC ${CMAKE_CURRENT_LIST_DIR}/vorn_dbus.cpp)
target_include_directories(qor_vorn_dbus PUBLIC ${CMAKE_CURRENT_LIST_DIR})
target_link_libraries(qor_vorn_dbus PUBLIC qor_vorn PkgConfig::EFL PkgConfig::DBUS)
