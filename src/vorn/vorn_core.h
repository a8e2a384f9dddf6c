// Thermal core: the thermal thread.
#pragma once

// Thermal thread entry: initialises the thermal side and runs the Ecore main loop.
void *vorn_main(void *arg);
