// The event journal: escaping, numbering, one write per line.
#include "devsim_journal.h"

#include "qor_text.h"

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <fcntl.h>
#include <unistd.h>

size_t devsim_journal_format(char *out, size_t size, unsigned long seq, std::string_view what,
			     std::string_view text)
{
	if (size == 0)
		return 0;
	size_t n = qor_format(out, size, "%lu ", seq);
	n += qor_copy(out + n, size - n, what);
	auto put = [&](char c) {
		if (n + 1 < size)
			out[n++] = c;
	};
	put(' ');
	for (char c : text) {
		if (c == '\\') {
			put('\\');
			put('\\');
		} else if (c == '\n') {
			put('\\');
			put('n');
		} else {
			put(c);
		}
	}
	put('\n');
	out[n] = '\0';
	return n;
}

int devsim_journal_open(devsim_journal *j, const char *file)
{
	j->seq = 0;
	j->fd = -1;
	if (!file)
		return 0;
	j->fd = open(file, O_WRONLY | O_CREAT | O_TRUNC | O_APPEND | O_CLOEXEC, 0644);
	return j->fd < 0 ? -errno : 0;
}

void devsim_journal_close(devsim_journal *j)
{
	if (j->fd >= 0)
		close(j->fd);
	j->fd = -1;
}

void devsim_journal_event(devsim_journal *j, std::string_view what, std::string_view text)
{
	j->seq++;
	if (j->fd < 0)
		return;
	size_t n = devsim_journal_format(j->line, sizeof j->line, j->seq, what, text);
	ssize_t w = write(j->fd, j->line, n);
	if (w != static_cast<ssize_t>(n))
		fprintf(stderr, "qor-devsim: journal: event %lu not written: %s\n", j->seq,
			w < 0 ? strerror(errno) : "short write");
}
