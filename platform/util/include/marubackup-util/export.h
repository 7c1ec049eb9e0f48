#pragma once

/** Marks what `libmarubackup-util.so.1` exports. */
#define MARUBACKUP_UTIL_API __attribute__((visibility("default")))
