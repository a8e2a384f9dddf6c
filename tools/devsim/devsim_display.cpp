// Display service on sd-bus, driven by the emulator's event loop.
#include "devsim_display.h"

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <systemd/sd-bus.h>

namespace {

constexpr char DISPLAY_NAME[] = "org.vexel.system.corvad";
constexpr char DISPLAY_PATH[] = "/Org/Vexel/System/Corvad/Display";
constexpr char DISPLAY_INTERFACE[] = "org.vexel.system.corvad.display";

int display_set(sd_bus_message *m, void *userdata, sd_bus_error *)
{
	auto *d = static_cast<devsim_display *>(userdata);
	int32_t value;
	int r = sd_bus_message_read(m, "i", &value);
	if (r < 0)
		return r; // sd-bus answers with an error
	char text[160];
	snprintf(text, sizeof text, "%s %d", sd_bus_message_get_member(m), value);
	devsim_journal_event(d->journal, "dbus", text);
	return sd_bus_reply_method_return(m, "i", 0);
}

const sd_bus_vtable display_vtable[] = {
	SD_BUS_VTABLE_START(0),
	SD_BUS_METHOD("SetMaxBrightness", "i", "i", display_set, SD_BUS_VTABLE_UNPRIVILEGED),
	SD_BUS_METHOD("SetAutoToneForce", "i", "i", display_set, SD_BUS_VTABLE_UNPRIVILEGED),
	SD_BUS_VTABLE_END,
};

int fail(devsim_display *d, const char *what, int r)
{
	fprintf(stderr, "qor-devsim: display service: %s: %s\n", what, strerror(-r));
	devsim_display_stop(d);
	return -1;
}

} // namespace

int devsim_display_start(devsim_display *d, devsim_journal *journal)
{
	d->bus = nullptr;
	d->object = nullptr;
	d->journal = journal;
	int r = sd_bus_open_system(&d->bus);
	if (r < 0)
		return fail(d, "cannot connect to the system bus", r);
	r = sd_bus_add_object_vtable(d->bus, &d->object, DISPLAY_PATH, DISPLAY_INTERFACE, display_vtable, d);
	if (r < 0)
		return fail(d, "cannot register the object", r);
	r = sd_bus_request_name(d->bus, DISPLAY_NAME, 0);
	if (r < 0)
		return fail(d, "cannot own org.vexel.system.corvad", r);
	return 0;
}

void devsim_display_stop(devsim_display *d)
{
	d->object = sd_bus_slot_unref(d->object);
	d->bus = sd_bus_flush_close_unref(d->bus);
}

int devsim_display_fd(devsim_display *d, short *events, int *timeout_ms)
{
	int ev = sd_bus_get_events(d->bus);
	*events = ev < 0 ? 0 : static_cast<short>(ev);
	uint64_t usec = UINT64_MAX;
	*timeout_ms = -1;
	if (sd_bus_get_timeout(d->bus, &usec) >= 0 && usec != UINT64_MAX) {
		timespec now;
		clock_gettime(CLOCK_MONOTONIC, &now);
		uint64_t now_usec = static_cast<uint64_t>(now.tv_sec) * 1000000 + now.tv_nsec / 1000;
		uint64_t ms = usec <= now_usec ? 0 : (usec - now_usec + 999) / 1000;
		*timeout_ms = ms > 60000 ? 60000 : static_cast<int>(ms);
	}
	return sd_bus_get_fd(d->bus);
}

int devsim_display_dispatch(devsim_display *d)
{
	for (;;) {
		int r = sd_bus_process(d->bus, nullptr);
		if (r < 0) {
			fprintf(stderr, "qor-devsim: display service: bus lost: %s\n", strerror(-r));
			devsim_display_stop(d);
			return -1;
		}
		if (r == 0)
			return 0;
	}
}
