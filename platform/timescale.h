// VORN_TIME_SCALE: factor applied to every period the thermal side arms (default 1).
#pragma once

// Positive factor read from the environment once; malformed or non-positive values mean 1.
double qor_time_scale(void);
