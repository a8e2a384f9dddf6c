// Daemon entry: collects the activated sockets and runs the three threads.
#include "qor_log.h"
#include "qor_server.h"
#include "vorn/vorn_core.h"

#include <csignal>
#include <cstdio>
#include <initializer_list>
#include <pthread.h>

namespace {

// Signals Ecore turns into loop events; only the thermal thread takes them, so its handlers never
// run on a request thread or on this one.
sigset_t loop_signals()
{
	sigset_t set;
	sigemptyset(&set);
	for (int sig : {SIGHUP, SIGINT, SIGQUIT, SIGTERM, SIGUSR1, SIGUSR2, SIGPWR, SIGCHLD, SIGALRM})
		sigaddset(&set, sig);
	return set;
}

} // namespace

int main(int, char **)
{
	// Lines written by different threads must never be torn in a pipe or file.
	setvbuf(stdout, nullptr, _IOLBF, 0);
	const sigset_t signals = loop_signals();
	pthread_sigmask(SIG_BLOCK, &signals, nullptr); // inherited by every thread started below

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
	// Without the thermal loop nobody handles them: the default action ends the process again.
	for (int sig = 1; sig < NSIG; sig++)
		if (sigismember(&signals, sig) == 1)
			signal(sig, SIG_DFL);
	pthread_sigmask(SIG_UNBLOCK, &signals, nullptr);
	pthread_join(scenario_thread, nullptr);
	pthread_join(app_info_thread, nullptr);
	return 0;

fail:
	QOR_LOG("running_step=%d ret=%d", running_step, ret);
	return -1;
}
