#pragma once

/** Marks what `libtaskmanager.so.6` exports. */
#define TASKMANAGER_API __attribute__((visibility("default")))
