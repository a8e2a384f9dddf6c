// Wake-up alarms: one timerfd per alarm on CLOCK_BOOTTIME_ALARM (CLOCK_BOOTTIME where the process
// may not wake the system), watched by an Ecore fd handler of the thread that called tollmgr_init.
#include "tollmgr.h"
#include "timescale.h"

#include <Ecore.h>
#include <cerrno>
#include <cmath>
#include <cstdint>
#include <sys/timerfd.h>
#include <unistd.h>

namespace {

struct tollmgr_alarm {
	int id; // 0 = free slot
	int fd;
	Ecore_Fd_Handler *handler;
	tollmgr_cb cb;
	void *user_data;
	bool repeating;
};

constexpr int TOLLMGR_MAX_ALARMS = 32;
tollmgr_alarm alarms[TOLLMGR_MAX_ALARMS];
int next_alarm_id = 1;
bool initialised;
clockid_t alarm_clock = CLOCK_BOOTTIME_ALARM;

tollmgr_alarm *find_alarm(int id)
{
	if (id <= 0)
		return nullptr;
	for (auto &a : alarms)
		if (a.id == id)
			return &a;
	return nullptr;
}

void release_alarm(tollmgr_alarm *a)
{
	if (a->handler)
		ecore_main_fd_handler_del(a->handler);
	if (a->fd >= 0)
		close(a->fd);
	*a = tollmgr_alarm{0, -1, nullptr, nullptr, nullptr, false};
}

timespec to_timespec(double seconds)
{
	if (seconds < 0)
		seconds = 0;
	timespec ts;
	ts.tv_sec = static_cast<time_t>(seconds);
	ts.tv_nsec = static_cast<long>((seconds - static_cast<double>(ts.tv_sec)) * 1e9);
	return ts;
}

Eina_Bool alarm_fd_cb(void *data, Ecore_Fd_Handler *)
{
	int id = static_cast<int>(reinterpret_cast<intptr_t>(data));
	tollmgr_alarm *a = find_alarm(id);
	if (!a)
		return ECORE_CALLBACK_CANCEL;
	uint64_t expirations;
	if (read(a->fd, &expirations, sizeof expirations) != sizeof expirations)
		return ECORE_CALLBACK_RENEW; // spurious wake-up: the timer has not run out
	tollmgr_cb cb = a->cb;
	void *user_data = a->user_data;
	if (!a->repeating) {
		a->handler = nullptr; // Ecore drops the handler when we return CANCEL
		if (a->fd >= 0)
			close(a->fd);
		*a = tollmgr_alarm{0, -1, nullptr, nullptr, nullptr, false};
		cb(id, user_data);
		return ECORE_CALLBACK_CANCEL;
	}
	cb(id, user_data);
	// The handler may have removed its own alarm.
	return find_alarm(id) ? ECORE_CALLBACK_RENEW : ECORE_CALLBACK_CANCEL;
}

} // namespace

int tollmgr_init(const char *app_id)
{
	if (!app_id || !*app_id)
		return -EINVAL;
	if (!initialised) {
		for (auto &a : alarms)
			a = tollmgr_alarm{0, -1, nullptr, nullptr, nullptr, false};
		int probe = timerfd_create(CLOCK_BOOTTIME_ALARM, TFD_NONBLOCK | TFD_CLOEXEC);
		if (probe < 0) {
			alarm_clock = CLOCK_BOOTTIME;
		} else {
			close(probe);
		}
		initialised = true;
	}
	return 0;
}

int tollmgr_add_alarm_withcb(int type, time_t first, time_t interval, tollmgr_cb handler, void *user_data,
			     int *alarm_id)
{
	(void)type;
	if (!initialised)
		return -ENOTCONN;
	if (!handler || !alarm_id || first < 0 || interval < 0)
		return -EINVAL;
	tollmgr_alarm *slot = nullptr;
	for (auto &a : alarms)
		if (a.id == 0) {
			slot = &a;
			break;
		}
	if (!slot)
		return -ENOSPC;

	int fd = timerfd_create(alarm_clock, TFD_NONBLOCK | TFD_CLOEXEC);
	if (fd < 0)
		return -errno;
	double scale = qor_time_scale();
	itimerspec its{};
	its.it_value = to_timespec(static_cast<double>(first) * scale);
	if (its.it_value.tv_sec == 0 && its.it_value.tv_nsec == 0)
		its.it_value.tv_nsec = 1; // zero would disarm: "at once" means the next loop turn
	its.it_interval = to_timespec(static_cast<double>(interval) * scale);
	if (timerfd_settime(fd, 0, &its, nullptr) < 0) {
		int err = -errno;
		close(fd);
		return err;
	}
	int id = next_alarm_id++;
	Ecore_Fd_Handler *h = ecore_main_fd_handler_add(fd, ECORE_FD_READ, alarm_fd_cb,
							reinterpret_cast<void *>(static_cast<intptr_t>(id)),
							nullptr, nullptr);
	if (!h) {
		close(fd);
		return -ENOMEM;
	}
	*slot = tollmgr_alarm{id, fd, h, handler, user_data, interval > 0};
	*alarm_id = id;
	return 0;
}

int tollmgr_remove_alarm(int alarm_id)
{
	tollmgr_alarm *a = find_alarm(alarm_id);
	if (!a)
		return -ENOENT;
	release_alarm(a);
	return 0;
}

int tollmgr_get_next_duetime(int alarm_id, time_t *due)
{
	tollmgr_alarm *a = find_alarm(alarm_id);
	if (!a || !due)
		return -EINVAL;
	itimerspec cur;
	if (timerfd_gettime(a->fd, &cur) < 0)
		return -errno;
	// The timer runs scaled; the due time is reported in nominal seconds.
	double left = (static_cast<double>(cur.it_value.tv_sec) + cur.it_value.tv_nsec / 1e9) / qor_time_scale();
	*due = time(nullptr) + static_cast<time_t>(std::lround(left));
	return 0;
}
