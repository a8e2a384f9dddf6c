// FUSE low-level operations of the node tree and the kernel-log file. Requests are served one
// at a time by the caller's loop, so the journal lists events in the order they happened.
#define FUSE_USE_VERSION FUSE_MAKE_VERSION(3, 12)
#include "devsim_fs.h"

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fuse_lowlevel.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

// The tree never changes shape and its attributes are fixed, so the kernel may keep them.
constexpr double DEVSIM_CACHE_SECONDS = 3600.0;
// Size that sysfs reports for its attribute files.
constexpr off_t DEVSIM_NODE_SIZE = 4096;
// Preferred I/O size: buffered writers then hand over a whole text, even an over-long one,
// in one write, so that it is taken or refused as a whole.
constexpr blksize_t DEVSIM_BLKSIZE = 65536;
constexpr char DEVSIM_KMSG_PATH[] = "/dev/kmsg";

// Rendered node text for the request being served.
char devsim_show_buf[DEVSIM_TEXT_MAX + 1];
// Request buffers of the node tree's session and the kernel log's; a request is served to
// the end before the next one is read.
fuse_buf devsim_bufs[2];

devsim_fs *fs_of(fuse_req_t req)
{
	return static_cast<devsim_fs *>(fuse_req_userdata(req));
}

bool fill_attr(const devsim_model *m, fuse_ino_t ino, struct stat *st)
{
	const devsim_entry *e = devsim_get(m, static_cast<int>(ino));
	if (!e)
		return false;
	memset(st, 0, sizeof *st);
	st->st_ino = ino;
	st->st_uid = getuid();
	st->st_gid = getgid();
	st->st_blksize = DEVSIM_BLKSIZE;
	if (e->kind == DEVSIM_DIR) {
		st->st_mode = S_IFDIR | 0755;
		st->st_nlink = 2;
	} else {
		st->st_mode = S_IFREG | (devsim_writable(e) ? 0644 : 0444);
		st->st_nlink = 1;
		st->st_size = DEVSIM_NODE_SIZE;
	}
	return true;
}

void reply_attr(fuse_req_t req, const devsim_model *m, fuse_ino_t ino)
{
	struct stat st;
	if (!fill_attr(m, ino, &st))
		fuse_reply_err(req, ENOENT);
	else
		fuse_reply_attr(req, &st, DEVSIM_CACHE_SECONDS);
}

// A write is one whole value whatever its offset; texts beyond a node's size are refused
// before they reach it. Returns 0 or -errno.
int take_write(devsim_fs *fs, const char *path, const char *buf, size_t size, int ino)
{
	if (size > DEVSIM_TEXT_MAX)
		return -EINVAL;
	devsim_journal_event(fs->journal, path, std::string_view(buf, size));
	return ino ? devsim_store(fs->model, ino, std::string_view(buf, size)) : 0;
}

void reply_write_result(fuse_req_t req, int r, size_t size)
{
	if (r < 0)
		fuse_reply_err(req, -r);
	else
		fuse_reply_write(req, size);
}

void sys_lookup(fuse_req_t req, fuse_ino_t parent, const char *name)
{
	const devsim_model *m = fs_of(req)->model;
	const devsim_entry *dir = devsim_get(m, static_cast<int>(parent));
	if (!dir || dir->kind != DEVSIM_DIR) {
		fuse_reply_err(req, ENOTDIR);
		return;
	}
	int ino = devsim_lookup(m, static_cast<int>(parent), name);
	fuse_entry_param ep;
	memset(&ep, 0, sizeof ep);
	if (!ino || !fill_attr(m, ino, &ep.attr)) {
		fuse_reply_err(req, ENOENT);
		return;
	}
	ep.ino = ino;
	ep.attr_timeout = DEVSIM_CACHE_SECONDS;
	ep.entry_timeout = DEVSIM_CACHE_SECONDS;
	fuse_reply_entry(req, &ep);
}

void sys_getattr(fuse_req_t req, fuse_ino_t ino, fuse_file_info *)
{
	reply_attr(req, fs_of(req)->model, ino);
}

// Truncation and time stamps are accepted and change nothing: a truncating open is not a write.
void sys_setattr(fuse_req_t req, fuse_ino_t ino, struct stat *, int to_set, fuse_file_info *)
{
	if (to_set & (FUSE_SET_ATTR_MODE | FUSE_SET_ATTR_UID | FUSE_SET_ATTR_GID)) {
		fuse_reply_err(req, EPERM);
		return;
	}
	reply_attr(req, fs_of(req)->model, ino);
}

void sys_open(fuse_req_t req, fuse_ino_t ino, fuse_file_info *fi)
{
	const devsim_entry *e = devsim_get(fs_of(req)->model, static_cast<int>(ino));
	if (!e) {
		fuse_reply_err(req, ENOENT);
		return;
	}
	if (e->kind == DEVSIM_DIR) {
		fuse_reply_err(req, EISDIR);
		return;
	}
	if ((fi->flags & O_ACCMODE) != O_RDONLY && !devsim_writable(e)) {
		fuse_reply_err(req, EACCES);
		return;
	}
	fi->direct_io = 1; // every read shows the present value, every write reaches us
	fuse_reply_open(req, fi);
}

void sys_read(fuse_req_t req, fuse_ino_t ino, size_t size, off_t off, fuse_file_info *)
{
	int n = devsim_show(fs_of(req)->model, static_cast<int>(ino), devsim_show_buf, sizeof devsim_show_buf);
	if (n < 0) {
		fuse_reply_err(req, -n);
		return;
	}
	size_t len = static_cast<size_t>(n);
	size_t start = off < 0 || static_cast<size_t>(off) > len ? len : static_cast<size_t>(off);
	size_t count = len - start < size ? len - start : size;
	fuse_reply_buf(req, devsim_show_buf + start, count);
}

void sys_write(fuse_req_t req, fuse_ino_t ino, const char *buf, size_t size, off_t, fuse_file_info *)
{
	devsim_fs *fs = fs_of(req);
	const devsim_entry *e = devsim_get(fs->model, static_cast<int>(ino));
	if (!e) {
		fuse_reply_err(req, ENOENT);
		return;
	}
	reply_write_result(req, take_write(fs, e->path, buf, size, static_cast<int>(ino)), size);
}

void sys_opendir(fuse_req_t req, fuse_ino_t ino, fuse_file_info *fi)
{
	const devsim_entry *e = devsim_get(fs_of(req)->model, static_cast<int>(ino));
	if (!e)
		fuse_reply_err(req, ENOENT);
	else if (e->kind != DEVSIM_DIR)
		fuse_reply_err(req, ENOTDIR);
	else
		fuse_reply_open(req, fi);
}

// Offsets: 1 after ".", 2 after "..", inode + 2 after a child (children come in inode order).
void sys_readdir(fuse_req_t req, fuse_ino_t ino, size_t size, off_t off, fuse_file_info *)
{
	const devsim_model *m = fs_of(req)->model;
	const devsim_entry *dir = devsim_get(m, static_cast<int>(ino));
	if (!dir || dir->kind != DEVSIM_DIR) {
		fuse_reply_err(req, ENOTDIR);
		return;
	}
	char buf[4096];
	size = size < sizeof buf ? size : sizeof buf;
	size_t used = 0;
	struct stat st;
	auto add = [&](const char *name, fuse_ino_t child, off_t next) {
		memset(&st, 0, sizeof st);
		st.st_ino = child;
		st.st_mode = devsim_get(m, static_cast<int>(child))->kind == DEVSIM_DIR ? S_IFDIR : S_IFREG;
		size_t need = fuse_add_direntry(req, buf + used, size - used, name, &st, next);
		if (need > size - used)
			return false;
		used += need;
		return true;
	};
	bool room = true;
	if (off < 1)
		room = add(".", ino, 1);
	if (room && off < 2)
		room = add("..", dir->parent, 2);
	int after = off > 2 ? static_cast<int>(off - 2) : 0;
	for (int c = devsim_next_child(m, static_cast<int>(ino), after); room && c;
	     c = devsim_next_child(m, static_cast<int>(ino), c))
		room = add(devsim_get(m, c)->name, c, c + 2);
	fuse_reply_buf(req, buf, used);
}

// The tree is the kernel's: nothing is created, removed or renamed. Opening an unknown node
// for writing, with or without O_CREAT, fails as a missing node does.
void sys_create(fuse_req_t req, fuse_ino_t, const char *, mode_t, fuse_file_info *)
{
	fuse_reply_err(req, ENOENT);
}

void sys_mknod(fuse_req_t req, fuse_ino_t, const char *, mode_t, dev_t)
{
	fuse_reply_err(req, ENOENT);
}

void sys_mkdir(fuse_req_t req, fuse_ino_t, const char *, mode_t)
{
	fuse_reply_err(req, EPERM);
}

void sys_remove(fuse_req_t req, fuse_ino_t, const char *)
{
	fuse_reply_err(req, EPERM);
}

void sys_rename(fuse_req_t req, fuse_ino_t, const char *, fuse_ino_t, const char *, unsigned int)
{
	fuse_reply_err(req, EPERM);
}

// The kernel-log mount: its root inode is the one regular file.
bool kmsg_attr(fuse_ino_t ino, struct stat *st)
{
	if (ino != FUSE_ROOT_ID)
		return false;
	memset(st, 0, sizeof *st);
	st->st_ino = ino;
	st->st_mode = S_IFREG | 0644;
	st->st_nlink = 1;
	st->st_uid = getuid();
	st->st_gid = getgid();
	st->st_blksize = DEVSIM_BLKSIZE;
	return true;
}

void kmsg_getattr(fuse_req_t req, fuse_ino_t ino, fuse_file_info *)
{
	struct stat st;
	if (!kmsg_attr(ino, &st))
		fuse_reply_err(req, ENOENT);
	else
		fuse_reply_attr(req, &st, DEVSIM_CACHE_SECONDS);
}

void kmsg_setattr(fuse_req_t req, fuse_ino_t ino, struct stat *, int to_set, fuse_file_info *fi)
{
	if (to_set & (FUSE_SET_ATTR_MODE | FUSE_SET_ATTR_UID | FUSE_SET_ATTR_GID))
		fuse_reply_err(req, EPERM);
	else
		kmsg_getattr(req, ino, fi);
}

void kmsg_open(fuse_req_t req, fuse_ino_t, fuse_file_info *fi)
{
	fi->direct_io = 1;
	fuse_reply_open(req, fi);
}

// The records are kept in the journal only; reading finds no more.
void kmsg_read(fuse_req_t req, fuse_ino_t, size_t, off_t, fuse_file_info *)
{
	fuse_reply_buf(req, nullptr, 0);
}

void kmsg_write(fuse_req_t req, fuse_ino_t, const char *buf, size_t size, off_t, fuse_file_info *)
{
	reply_write_result(req, take_write(fs_of(req), DEVSIM_KMSG_PATH, buf, size, 0), size);
}

void kmsg_lookup(fuse_req_t req, fuse_ino_t, const char *)
{
	fuse_reply_err(req, ENOTDIR);
}

fuse_session *new_session(devsim_fs *fs, const fuse_lowlevel_ops *ops, const char *fsname)
{
	char opts[128];
	snprintf(opts, sizeof opts, "fsname=%s,subtype=qor-devsim", fsname);
	char prog[] = "qor-devsim";
	char dash_o[] = "-o";
	char *argv[] = {prog, dash_o, opts, nullptr};
	fuse_args args = FUSE_ARGS_INIT(3, argv);
	fuse_session *se = fuse_session_new(&args, ops, sizeof *ops, fs);
	fuse_opt_free_args(&args);
	return se;
}

int mount_one(devsim_fs *fs, fuse_session **se, bool *mounted, const fuse_lowlevel_ops *ops,
	      const char *fsname, const char *where)
{
	*se = new_session(fs, ops, fsname);
	if (!*se) {
		fprintf(stderr, "qor-devsim: cannot set up the FUSE session for %s\n", where);
		return -1;
	}
	if (fuse_session_mount(*se, where) != 0) {
		fprintf(stderr, "qor-devsim: cannot mount on %s\n", where);
		return -1;
	}
	*mounted = true;
	return 0;
}

} // namespace

int devsim_fs_mount(devsim_fs *fs, const char *sys_dir, const char *kmsg_file)
{
	static fuse_lowlevel_ops sys_ops;
	static fuse_lowlevel_ops kmsg_ops;
	sys_ops.lookup = sys_lookup;
	sys_ops.getattr = sys_getattr;
	sys_ops.setattr = sys_setattr;
	sys_ops.open = sys_open;
	sys_ops.read = sys_read;
	sys_ops.write = sys_write;
	sys_ops.opendir = sys_opendir;
	sys_ops.readdir = sys_readdir;
	sys_ops.create = sys_create;
	sys_ops.mknod = sys_mknod;
	sys_ops.mkdir = sys_mkdir;
	sys_ops.unlink = sys_remove;
	sys_ops.rmdir = sys_remove;
	sys_ops.rename = sys_rename;
	kmsg_ops.lookup = kmsg_lookup;
	kmsg_ops.getattr = kmsg_getattr;
	kmsg_ops.setattr = kmsg_setattr;
	kmsg_ops.open = kmsg_open;
	kmsg_ops.read = kmsg_read;
	kmsg_ops.write = kmsg_write;

	fs->sys = fs->kmsg = nullptr;
	fs->sys_mounted = fs->kmsg_mounted = false;
	if (mount_one(fs, &fs->sys, &fs->sys_mounted, &sys_ops, "devsim-sys", sys_dir) < 0 ||
	    mount_one(fs, &fs->kmsg, &fs->kmsg_mounted, &kmsg_ops, "devsim-kmsg", kmsg_file) < 0) {
		devsim_fs_unmount(fs);
		return -1;
	}
	return 0;
}

void devsim_fs_unmount(devsim_fs *fs)
{
	fuse_session **sessions[] = {&fs->sys, &fs->kmsg}; // indexed like devsim_bufs
	bool *mounted[] = {&fs->sys_mounted, &fs->kmsg_mounted};
	for (int i = 0; i < 2; i++) {
		if (*sessions[i]) {
			if (*mounted[i])
				fuse_session_unmount(*sessions[i]);
			fuse_session_destroy(*sessions[i]);
		}
		*sessions[i] = nullptr;
		*mounted[i] = false;
		free(devsim_bufs[i].mem);
		devsim_bufs[i].mem = nullptr;
	}
}

int devsim_fs_fd(fuse_session *se)
{
	return fuse_session_fd(se);
}

int devsim_fs_serve(devsim_fs *fs, fuse_session *se)
{
	fuse_buf *buf = &devsim_bufs[se == fs->sys ? 0 : 1];
	int r = fuse_session_receive_buf(se, buf);
	if (r == -EINTR || r == -EAGAIN)
		return 0;
	if (r <= 0 || fuse_session_exited(se))
		return -1;
	fuse_session_process_buf(se, buf);
	return 0;
}
