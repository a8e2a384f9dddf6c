// Request server: activated sockets and the two request threads.
#pragma once

extern int scenario_info_fd;
extern int app_info_fd;

// Identifies the activated sockets by path; 0, -22 for a wrong set, or the activation error.
int QOR_socket_init(void);
void *QOR_scenario_thread(void *arg);
void *QOR_app_info_thread(void *arg);

// dst holds QOR_NAME_SIZE bytes. 0 on success, -1 token absent, -2 token empty.
int QOR_cut_token(char *dst, const char *src, const char *token, int *number);
// Turns a received scenario message into a request text (QOR_NAME_SIZE bytes); -1 when none results.
int qor_build_request(const char *received, char *cut1, char *cut2, char *request);
