// Platform wake-up alarms: handlers run on the Ecore loop of the thread that called tollmgr_init.
#pragma once
#include <ctime>

typedef int (*tollmgr_cb)(int alarm_id, void *user_data);

int tollmgr_init(const char *app_id);
// type 2 is the only kind the daemon uses; first and interval are seconds (interval 0 = once).
int tollmgr_add_alarm_withcb(int type, time_t first, time_t interval, tollmgr_cb handler, void *user_data,
			     int *alarm_id);
int tollmgr_remove_alarm(int alarm_id);
// Next due time of the alarm in seconds since the epoch.
int tollmgr_get_next_duetime(int alarm_id, time_t *due);
