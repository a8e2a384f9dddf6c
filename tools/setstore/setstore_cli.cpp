// setstore: reads, writes and watches settings-store keys from the shell, through the same
// library the daemon uses (so QOR_SYSROOT applies).
#include "setstore.h"

#include <Ecore.h>
#include <cerrno>
#include <charconv>
#include <cstdio>
#include <cstring>
#include <string_view>

namespace {

enum { EXIT_OK = 0, EXIT_FAILED = 1, EXIT_USAGE = 2 };

void usage(FILE *out)
{
	fputs("usage: setstore get KEY\n"
	      "       setstore set KEY VALUE\n"
	      "       setstore watch KEY...\n"
	      "Keys are files under $QOR_SYSROOT/var/lib/setstore holding one decimal value.\n"
	      "watch prints \"KEY VALUE\" for every change until SIGINT or SIGTERM.\n"
	      "Exit status: 0 done, 1 failed read or write, 2 bad usage.\n",
	      out);
}

int bad_usage(const char *why)
{
	fprintf(stderr, "setstore: %s\n", why);
	usage(stderr);
	return EXIT_USAGE;
}

bool parse_int(std::string_view text, int *value)
{
	if (!text.empty() && text.front() == '+')
		text.remove_prefix(1);
	auto [end, ec] = std::from_chars(text.data(), text.data() + text.size(), *value, 10);
	return !text.empty() && ec == std::errc() && end == text.data() + text.size();
}

int cmd_get(const char *key)
{
	int value;
	int r = setstore_get_int(key, &value);
	if (r < 0) {
		fprintf(stderr, "setstore: cannot read %s: %s\n", key, strerror(-r));
		return EXIT_FAILED;
	}
	printf("%d\n", value);
	return EXIT_OK;
}

int cmd_set(const char *key, const char *text)
{
	int value;
	if (!parse_int(text, &value))
		return bad_usage("VALUE must be a decimal integer");
	int r = setstore_set_int(key, value);
	if (r < 0) {
		fprintf(stderr, "setstore: cannot write %s: %s\n", key, strerror(-r));
		return EXIT_FAILED;
	}
	return EXIT_OK;
}

void key_changed(setstore_keynode_t *node, void *)
{
	const char *key = setstore_keynode_get_name(node);
	int value;
	int r = setstore_get_int(key, &value);
	if (r < 0)
		fprintf(stderr, "setstore: cannot read %s: %s\n", key, strerror(-r));
	else
		printf("%s %d\n", key, value);
	fflush(stdout);
}

Eina_Bool quit_on_signal(void *, int, void *)
{
	ecore_main_loop_quit();
	return ECORE_CALLBACK_DONE;
}

int cmd_watch(int nkeys, char **keys)
{
	ecore_app_no_system_modules();
	if (!ecore_init()) {
		fputs("setstore: cannot start the event loop\n", stderr);
		return EXIT_FAILED;
	}
	int status = EXIT_OK;
	for (int i = 0; i < nkeys && status == EXIT_OK; i++) {
		int r = setstore_notify_key_changed(keys[i], key_changed, nullptr);
		if (r < 0) {
			fprintf(stderr, "setstore: cannot watch %s: %s\n", keys[i], strerror(-r));
			status = EXIT_FAILED;
		}
	}
	if (status == EXIT_OK) {
		ecore_event_handler_add(ECORE_EVENT_SIGNAL_EXIT, quit_on_signal, nullptr);
		ecore_main_loop_begin();
	}
	// Registrations live for the process, so Ecore is not shut down under them.
	return status;
}

} // namespace

int main(int argc, char **argv)
{
	if (argc == 2 && (strcmp(argv[1], "--help") == 0 || strcmp(argv[1], "-h") == 0)) {
		usage(stdout);
		return EXIT_OK;
	}
	if (argc < 2)
		return bad_usage("missing command");
	std::string_view cmd(argv[1]);
	if (cmd == "get" && argc == 3)
		return cmd_get(argv[2]);
	if (cmd == "set" && argc == 4)
		return cmd_set(argv[2], argv[3]);
	if (cmd == "watch" && argc >= 3)
		return cmd_watch(argc - 2, argv + 2);
	if (cmd == "get" || cmd == "set" || cmd == "watch")
		return bad_usage("wrong number of arguments");
	return bad_usage("unknown command");
}
