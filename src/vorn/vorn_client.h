// Posts one text to the thermal event socket.
#pragma once

// 0 when written; -22 text missing, -19 no socket, -5 connect or write failed.
int vorn_send_event(const char *text);
