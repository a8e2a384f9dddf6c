// The platform's display service as the daemon calls it on the system bus: two int32 setters,
// each answered with 0 and journaled.
#pragma once

#include "devsim_journal.h"

struct sd_bus;
struct sd_bus_slot;

struct devsim_display {
	sd_bus *bus;
	sd_bus_slot *object;
	devsim_journal *journal;
};

// Connects to the bus named by DBUS_SYSTEM_BUS_ADDRESS, registers the object and owns the name.
// 0, or -1 after a message on stderr.
int devsim_display_start(devsim_display *d, devsim_journal *journal);
void devsim_display_stop(devsim_display *d);
// Poll parameters of the bus connection: fd, events, and a timeout in ms (-1: none).
int devsim_display_fd(devsim_display *d, short *events, int *timeout_ms);
// Handles whatever the connection has ready. 0, or -1 when the bus is gone (the service then ends).
int devsim_display_dispatch(devsim_display *d);
