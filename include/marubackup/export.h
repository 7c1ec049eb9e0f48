#pragma once

/**
 * Marks what the library exports. Everything without the mark stays inside
 * `libmarubackup-si.so.6`; the exported symbols are held against a checked-in
 * list, so that nothing enters or leaves the interface unnoticed.
 */
#define MARUBACKUP_API __attribute__((visibility("default")))
