// Thermal core: the thermal thread and its Ecore main loop.
#include "vorn_core.h"

#include <Ecore.h>

void *vorn_main(void *)
{
	// Ecore must not open bus connections of its own.
	ecore_app_no_system_modules();
	ecore_init();
	ecore_main_loop_begin();
	ecore_shutdown();
	return nullptr;
}
