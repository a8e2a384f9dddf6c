// The two FUSE mounts of the emulated phone: the node tree at ROOT/sys and the kernel log at
// ROOT/dev/kmsg, both served from the caller's single event loop.
#pragma once

#include "devsim_journal.h"
#include "devsim_nodes.h"

struct fuse_session;

struct devsim_fs {
	devsim_model *model;
	devsim_journal *journal;
	fuse_session *sys;  // the node tree
	fuse_session *kmsg; // a single-file mount: each write is one record
	bool sys_mounted;
	bool kmsg_mounted;
};

// Mounts the tree on sys_dir and the kernel log on kmsg_file (an existing regular file).
// 0, or -1 after a message on stderr, with nothing left mounted.
int devsim_fs_mount(devsim_fs *fs, const char *sys_dir, const char *kmsg_file);
// Unmounts what is mounted and frees the sessions.
void devsim_fs_unmount(devsim_fs *fs);
int devsim_fs_fd(fuse_session *se);
// Serves the request waiting on se (fs->sys or fs->kmsg). 0, or -1 when the mount has gone away.
int devsim_fs_serve(devsim_fs *fs, fuse_session *se);
