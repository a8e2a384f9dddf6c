// Settings store: one file per key under $QOR_SYSROOT/var/lib/setstore, replaced by rename, with
// change notification through inotify on the key's directory, delivered on the caller's Ecore loop.
#include "setstore.h"
#include "sysroot.h"

#include <Ecore.h>
#include <cerrno>
#include <charconv>
#include <cstdio>
#include <cstring>
#include <fcntl.h>
#include <string_view>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

constexpr const char SETSTORE_DIR[] = "/var/lib/setstore/";
constexpr size_t SETSTORE_KEY_MAX = 256; // key text, terminator included
constexpr size_t SETSTORE_VALUE_MAX = 32; // longest accepted file: "-2147483648\n" and then some
constexpr int SETSTORE_MAX_NODES = 64;

} // namespace

struct setstore_keynode {
	char key[SETSTORE_KEY_MAX];
	const char *name; // last component of key, the file name inotify reports
	int wd;
	setstore_changed_cb cb;
	void *user_data;
};

namespace {

// Registrations live as long as the process; they are made and served on the Ecore loop's thread.
setstore_keynode nodes[SETSTORE_MAX_NODES];
int node_count;
int inotify_fd = -1;
Ecore_Fd_Handler *inotify_handler;

// A key is a relative slash path of plain names: no empty, "." or ".." component.
bool key_is_valid(const char *key)
{
	if (!key)
		return false;
	std::string_view k(key);
	if (k.empty() || k.size() >= SETSTORE_KEY_MAX)
		return false;
	size_t start = 0;
	for (;;) {
		size_t end = k.find('/', start);
		std::string_view part = k.substr(start, end == std::string_view::npos ? std::string_view::npos : end - start);
		if (part.empty() || part == "." || part == "..")
			return false;
		if (end == std::string_view::npos)
			return true;
		start = end + 1;
	}
}

int key_path(const char *key, char (&out)[QOR_PATH_MAX])
{
	if (!key_is_valid(key))
		return -EINVAL;
	char dev_path[sizeof SETSTORE_DIR + SETSTORE_KEY_MAX];
	snprintf(dev_path, sizeof dev_path, "%s%s", SETSTORE_DIR, key);
	return qor_path(dev_path, out);
}

// Like mkdir -p; path is modified in place while walking and restored.
int make_dirs(char *path)
{
	for (char *p = path + 1;; p++) {
		if (*p != '/' && *p != '\0')
			continue;
		char saved = *p;
		*p = '\0';
		int r = mkdir(path, 0755);
		int err = errno;
		*p = saved;
		if (r < 0 && err != EEXIST)
			return -err;
		if (saved == '\0')
			return 0;
	}
}

// Decimal value, optional leading minus, optional single trailing newline; anything else fails.
int parse_value(std::string_view text, int *value)
{
	if (!text.empty() && text.back() == '\n')
		text.remove_suffix(1);
	if (text.empty() || text.front() == '+')
		return -EINVAL;
	int v = 0;
	auto [end, ec] = std::from_chars(text.data(), text.data() + text.size(), v, 10);
	if (ec != std::errc() || end != text.data() + text.size())
		return -EINVAL;
	*value = v;
	return 0;
}

int read_value(const char *key, int *value)
{
	char path[QOR_PATH_MAX];
	int r = key_path(key, path);
	if (r < 0)
		return r;
	int fd = open(path, O_RDONLY | O_CLOEXEC);
	if (fd < 0)
		return -errno;
	char buf[SETSTORE_VALUE_MAX];
	size_t len = 0;
	for (;;) {
		ssize_t n = read(fd, buf + len, sizeof buf - len);
		if (n < 0 && errno == EINTR)
			continue;
		if (n < 0) {
			r = -errno;
			close(fd);
			return r;
		}
		if (n == 0)
			break;
		len += static_cast<size_t>(n);
		if (len == sizeof buf) { // longer than any value we write: not ours
			close(fd);
			return -EINVAL;
		}
	}
	close(fd);
	return parse_value(std::string_view(buf, len), value);
}

int write_all(int fd, const char *buf, size_t len)
{
	while (len > 0) {
		ssize_t n = write(fd, buf, len);
		if (n < 0 && errno == EINTR)
			continue;
		if (n < 0)
			return -errno;
		buf += n;
		len -= static_cast<size_t>(n);
	}
	return 0;
}

// Runs the callbacks of every key whose file was completed in a watched directory.
Eina_Bool inotify_ready(void *, Ecore_Fd_Handler *)
{
	alignas(inotify_event) char buf[4096];
	for (;;) {
		ssize_t n = read(inotify_fd, buf, sizeof buf);
		if (n < 0 && errno == EINTR)
			continue;
		if (n <= 0)
			return ECORE_CALLBACK_RENEW;
		for (ssize_t off = 0; off < n;) {
			const auto *ev = reinterpret_cast<const inotify_event *>(buf + off);
			off += static_cast<ssize_t>(sizeof *ev + ev->len);
			if (ev->mask & IN_IGNORED) { // directory gone: its watch number may be handed out again
				for (int i = 0; i < node_count; i++)
					if (nodes[i].wd == ev->wd)
						nodes[i].wd = -1;
				continue;
			}
			// A lost queue may have hidden any change: tell every watcher.
			bool overflow = ev->mask & IN_Q_OVERFLOW;
			if (!overflow && (ev->len == 0 || !(ev->mask & (IN_MOVED_TO | IN_CLOSE_WRITE))))
				continue;
			// A callback may register further keys; those see only later events.
			int count = node_count;
			for (int i = 0; i < count; i++) {
				setstore_keynode *node = &nodes[i];
				if (overflow || (node->wd == ev->wd && strcmp(node->name, ev->name) == 0))
					node->cb(node, node->user_data);
			}
		}
	}
}

int ensure_inotify()
{
	if (inotify_fd >= 0)
		return 0;
	int fd = inotify_init1(IN_NONBLOCK | IN_CLOEXEC);
	if (fd < 0)
		return -errno;
	Ecore_Fd_Handler *h = ecore_main_fd_handler_add(fd, ECORE_FD_READ, inotify_ready, nullptr, nullptr, nullptr);
	if (!h) {
		close(fd);
		return -ENOMEM;
	}
	inotify_fd = fd;
	inotify_handler = h;
	return 0;
}

} // namespace

int setstore_get_int(const char *key, int *value)
{
	if (!value)
		return -EINVAL;
	return read_value(key, value);
}

// Booleans are stored as 0 or 1; any other number is not a boolean and fails like garbage.
int setstore_get_bool(const char *key, bool *value)
{
	if (!value)
		return -EINVAL;
	int v;
	int r = read_value(key, &v);
	if (r < 0)
		return r;
	if (v != 0 && v != 1)
		return -EINVAL;
	*value = v == 1;
	return 0;
}

int setstore_set_int(const char *key, int value)
{
	char path[QOR_PATH_MAX];
	int r = key_path(key, path);
	if (r < 0)
		return r;
	char *slash = strrchr(path, '/');
	*slash = '\0';
	r = make_dirs(path);
	*slash = '/';
	if (r < 0)
		return r;

	// The temporary file sits beside the key, so the rename is atomic and readers see the old
	// or the new value, never a part of one. Its dot name never matches a key's watch.
	char tmp[QOR_PATH_MAX];
	int n = snprintf(tmp, sizeof tmp, "%.*s/.%s.XXXXXX", static_cast<int>(slash - path), path, slash + 1);
	if (n < 0 || static_cast<size_t>(n) >= sizeof tmp)
		return -ENAMETOOLONG;
	int fd = mkostemp(tmp, O_CLOEXEC);
	if (fd < 0)
		return -errno;
	char text[SETSTORE_VALUE_MAX];
	int len = snprintf(text, sizeof text, "%d\n", value);
	r = write_all(fd, text, static_cast<size_t>(len));
	if (r == 0 && fchmod(fd, 0644) < 0)
		r = -errno;
	if (close(fd) < 0 && r == 0)
		r = -errno;
	if (r == 0 && rename(tmp, path) < 0)
		r = -errno;
	if (r < 0)
		unlink(tmp);
	return r;
}

int setstore_notify_key_changed(const char *key, setstore_changed_cb cb, void *user_data)
{
	if (!cb)
		return -EINVAL;
	char path[QOR_PATH_MAX];
	int r = key_path(key, path);
	if (r < 0)
		return r;
	if (node_count == SETSTORE_MAX_NODES)
		return -ENOSPC;
	// The directory is made now, so that the first write of the key is seen too.
	char *slash = strrchr(path, '/');
	*slash = '\0';
	r = make_dirs(path);
	if (r < 0)
		return r;
	r = ensure_inotify();
	if (r < 0)
		return r;
	// Same directory again: the kernel hands back the same watch number.
	int wd = inotify_add_watch(inotify_fd, path, IN_MOVED_TO | IN_CLOSE_WRITE | IN_ONLYDIR);
	if (wd < 0)
		return -errno;
	setstore_keynode *node = &nodes[node_count];
	snprintf(node->key, sizeof node->key, "%s", key);
	const char *last = strrchr(node->key, '/');
	node->name = last ? last + 1 : node->key;
	node->wd = wd;
	node->cb = cb;
	node->user_data = user_data;
	node_count++;
	return 0;
}

const char *setstore_keynode_get_name(const setstore_keynode_t *node)
{
	return node ? node->key : nullptr;
}
