// qor-devsim: plays the phone's kernel (ROOT/sys, ROOT/dev/kmsg) and its display service,
// all served by one event loop so that the journal keeps the order of events.
#include "devsim_display.h"
#include "devsim_fs.h"
#include "devsim_journal.h"
#include "devsim_nodes.h"

#include <cerrno>
#include <climits>
#include <csignal>
#include <cstdint>
#include <cstdlib>
#include <cstdio>
#include <cstring>
#include <fcntl.h>
#include <getopt.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/signalfd.h>
#include <sys/stat.h>
#include <sys/vfs.h>
#include <thread>
#include <unistd.h>

namespace {

constexpr long FUSE_SUPER_MAGIC = 0x65735546;
constexpr uint64_t PROBE_OK = 1;
constexpr uint64_t PROBE_FAILED = 2;

struct devsim_paths {
	char sys[PATH_MAX];
	char dev[PATH_MAX];
	char kmsg[PATH_MAX];
	char probe[PATH_MAX]; // a node that only the mounted tree has
};

devsim_model model; // large: kept out of the stack

void usage(void)
{
	fprintf(stderr, "usage: qor-devsim --root DIR [--journal FILE] [--no-display]\n");
}

bool join_path(char (&out)[PATH_MAX], const char *root, const char *rel)
{
	int n = snprintf(out, sizeof out, "%s%s", strcmp(root, "/") == 0 ? "" : root, rel);
	return n > 0 && static_cast<size_t>(n) < sizeof out;
}

int refuse(const char *path, const char *why)
{
	fprintf(stderr, "qor-devsim: cannot use %s as a mount point: %s\n", path, why);
	return -1;
}

// path must be of the given type (S_IFDIR or S_IFREG) and not already mounted on.
int check_mount_point(const char *path, const char *parent, mode_t type)
{
	struct stat st, up;
	if (stat(path, &st) < 0)
		return refuse(path, strerror(errno));
	if ((st.st_mode & S_IFMT) != type)
		return refuse(path, type == S_IFDIR ? "not a directory" : "not a regular file");
	if (stat(parent, &up) < 0)
		return refuse(parent, strerror(errno));
	if (st.st_dev != up.st_dev)
		return refuse(path, "something is mounted there already");
	return 0;
}

// Lays out ROOT/sys and ROOT/dev/kmsg (kept when present) and checks that both can be mounted on.
int prepare_root(const char *root, devsim_paths *p)
{
	struct stat st;
	if (stat(root, &st) < 0 || !S_ISDIR(st.st_mode)) {
		fprintf(stderr, "qor-devsim: root %s: not a directory\n", root);
		return -1;
	}
	if (!join_path(p->sys, root, "/sys") || !join_path(p->dev, root, "/dev") ||
	    !join_path(p->kmsg, root, "/dev/kmsg") || !join_path(p->probe, root, "/sys/power/gpufreq_min_limit")) {
		fprintf(stderr, "qor-devsim: root %s: path too long\n", root);
		return -1;
	}
	if (mkdir(p->sys, 0755) < 0 && errno != EEXIST)
		return refuse(p->sys, strerror(errno));
	if (mkdir(p->dev, 0755) < 0 && errno != EEXIST)
		return refuse(p->dev, strerror(errno));
	if (check_mount_point(p->sys, root, S_IFDIR) < 0)
		return -1;
	int fd = open(p->kmsg, O_WRONLY | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, 0644);
	if (fd >= 0)
		close(fd);
	return check_mount_point(p->kmsg, p->dev, S_IFREG);
}

// Runs beside the loop: the mounts answer once stat through them reaches the loop and back.
void probe_mounts(const devsim_paths *p, int done_fd)
{
	struct statfs fs_sys, fs_kmsg;
	struct stat st;
	bool ok = stat(p->probe, &st) == 0 && S_ISREG(st.st_mode) && statfs(p->sys, &fs_sys) == 0 &&
		  fs_sys.f_type == FUSE_SUPER_MAGIC && statfs(p->kmsg, &fs_kmsg) == 0 &&
		  fs_kmsg.f_type == FUSE_SUPER_MAGIC;
	uint64_t v = ok ? PROBE_OK : PROBE_FAILED;
	if (write(done_fd, &v, sizeof v) != sizeof v)
		perror("qor-devsim: probe");
}

struct devsim_options {
	const char *root = nullptr;
	const char *journal = nullptr;
	bool display = true;
};

int parse_options(int argc, char **argv, devsim_options *o)
{
	static const option longopts[] = {
		{"root", required_argument, nullptr, 'r'},
		{"journal", required_argument, nullptr, 'j'},
		{"no-display", no_argument, nullptr, 'n'},
		{nullptr, 0, nullptr, 0},
	};
	int c;
	while ((c = getopt_long(argc, argv, "", longopts, nullptr)) != -1) {
		switch (c) {
		case 'r':
			o->root = optarg;
			break;
		case 'j':
			o->journal = optarg;
			break;
		case 'n':
			o->display = false;
			break;
		default:
			return -1;
		}
	}
	return o->root && optind == argc ? 0 : -1;
}

enum { POLL_SIGNAL, POLL_PROBE, POLL_SYS, POLL_KMSG, POLL_BUS, POLL_COUNT };

// Serves everything until a signal (0) or a failure (1).
int run_loop(devsim_fs *fs, devsim_display *display, bool *display_up, int sig_fd, int probe_fd)
{
	pollfd pfd[POLL_COUNT];
	for (;;) {
		int timeout = -1;
		pfd[POLL_SIGNAL] = {sig_fd, POLLIN, 0};
		pfd[POLL_PROBE] = {probe_fd, POLLIN, 0};
		pfd[POLL_SYS] = {devsim_fs_fd(fs->sys), POLLIN, 0};
		pfd[POLL_KMSG] = {devsim_fs_fd(fs->kmsg), POLLIN, 0};
		pfd[POLL_BUS] = {-1, 0, 0};
		if (*display_up)
			pfd[POLL_BUS].fd = devsim_display_fd(display, &pfd[POLL_BUS].events, &timeout);
		if (poll(pfd, POLL_COUNT, timeout) < 0) {
			if (errno == EINTR)
				continue;
			perror("qor-devsim: poll");
			return 1;
		}
		if (pfd[POLL_SIGNAL].revents)
			return 0;
		if (pfd[POLL_PROBE].revents) {
			uint64_t v = 0;
			if (read(probe_fd, &v, sizeof v) == sizeof v && v == PROBE_OK) {
				printf("qor-devsim: ready\n");
				fflush(stdout);
			} else {
				fprintf(stderr, "qor-devsim: the mounts do not answer\n");
				return 1;
			}
		}
		for (int i : {POLL_SYS, POLL_KMSG}) {
			if (!pfd[i].revents)
				continue;
			if (devsim_fs_serve(fs, i == POLL_SYS ? fs->sys : fs->kmsg) < 0) {
				fprintf(stderr, "qor-devsim: %s was unmounted behind our back\n",
					i == POLL_SYS ? "the node tree" : "the kernel log");
				return 1;
			}
		}
		// Also on a timeout: sd-bus keeps its own deadlines.
		if (*display_up && devsim_display_dispatch(display) < 0)
			*display_up = false;
	}
}

} // namespace

int main(int argc, char **argv)
{
	devsim_options opt;
	if (parse_options(argc, argv, &opt) < 0) {
		usage();
		return 2;
	}
	signal(SIGPIPE, SIG_IGN);
	static char root[PATH_MAX];
	if (!realpath(opt.root, root)) {
		fprintf(stderr, "qor-devsim: root %s: %s\n", opt.root, strerror(errno));
		return 1;
	}
	static devsim_paths paths;
	if (prepare_root(root, &paths) < 0)
		return 1;
	if (devsim_model_init(&model) < 0) {
		fprintf(stderr, "qor-devsim: node table too large\n");
		return 1;
	}
	static devsim_journal journal;
	int r = devsim_journal_open(&journal, opt.journal);
	if (r < 0) {
		fprintf(stderr, "qor-devsim: journal %s: %s\n", opt.journal, strerror(-r));
		return 1;
	}
	devsim_display display{};
	bool display_up = false;
	if (opt.display) {
		if (devsim_display_start(&display, &journal) < 0)
			return 1;
		display_up = true;
	}
	// Until something is mounted a stop signal may simply end the process; from then on the
	// loop takes it, so that the mounts go away first. Blocked before any thread starts.
	sigset_t stop_signals;
	sigemptyset(&stop_signals);
	sigaddset(&stop_signals, SIGINT);
	sigaddset(&stop_signals, SIGTERM);
	sigprocmask(SIG_BLOCK, &stop_signals, nullptr);
	int sig_fd = signalfd(-1, &stop_signals, SFD_CLOEXEC);
	int probe_fd = eventfd(0, EFD_CLOEXEC);
	if (sig_fd < 0 || probe_fd < 0) {
		perror("qor-devsim");
		return 1;
	}
	devsim_fs fs{};
	fs.model = &model;
	fs.journal = &journal;
	int status = 1;
	if (devsim_fs_mount(&fs, paths.sys, paths.kmsg) == 0) {
		std::thread probe(probe_mounts, &paths, probe_fd);
		status = run_loop(&fs, &display, &display_up, sig_fd, probe_fd);
		devsim_fs_unmount(&fs); // also ends a probe still waiting on the mounts
		probe.join();
	}
	if (display_up)
		devsim_display_stop(&display);
	devsim_journal_close(&journal);
	return status;
}
