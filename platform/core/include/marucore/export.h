#pragma once

/** Marks what `libmarucore.so.1` exports. */
#define MARUCORE_API __attribute__((visibility("default")))
