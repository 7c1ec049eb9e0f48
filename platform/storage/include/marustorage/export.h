#pragma once

/** Marks what `libmarustorage.so.1` exports. */
#define MARUSTORAGE_API __attribute__((visibility("default")))
