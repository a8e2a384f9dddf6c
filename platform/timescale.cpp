// Reads VORN_TIME_SCALE once per process.
#include "timescale.h"

#include <cmath>
#include <cstdlib>

double qor_time_scale(void)
{
	static const double scale = [] {
		const char *s = getenv("VORN_TIME_SCALE");
		if (!s || !*s)
			return 1.0;
		char *end = nullptr;
		double v = strtod(s, &end);
		if (end == s || *end != '\0' || !std::isfinite(v) || v <= 0.0)
			return 1.0;
		return v;
	}();
	return scale;
}
