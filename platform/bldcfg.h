// Build configuration query.
#pragma once

// 1 on a factory build, else 0.
int bldcfg_is_factory_binary(void);
