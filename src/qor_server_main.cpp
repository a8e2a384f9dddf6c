// Daemon entry: collects the activated sockets and runs the three threads.
#include "qor_log.h"
#include "qor_server.h"
#include "vorn/vorn_core.h"

#include <pthread.h>

int main(int, char **)
{
	pthread_t scenario_thread, app_info_thread, vorn_thread;
	int running_step = 1;
	int ret = QOR_socket_init();
	if (ret < 0)
		goto fail;
	running_step = 2;
	ret = pthread_create(&scenario_thread, nullptr, QOR_scenario_thread, nullptr);
	if (ret != 0)
		goto fail;
	running_step = 4;
	ret = pthread_create(&app_info_thread, nullptr, QOR_app_info_thread, nullptr);
	if (ret != 0)
		goto fail;
	running_step = 6;
	ret = pthread_create(&vorn_thread, nullptr, vorn_main, nullptr);
	if (ret != 0)
		goto fail;

	pthread_join(vorn_thread, nullptr);
	pthread_join(scenario_thread, nullptr);
	pthread_join(app_info_thread, nullptr);
	return 0;

fail:
	QOR_LOG("running_step=%d ret=%d", running_step, ret);
	return -1;
}
