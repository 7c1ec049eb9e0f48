#pragma once

// VFORK_IS_FORK is defined where vfork() does not share memory: the thread
// sanitizer puts fork() in its place.
#if defined(__SANITIZE_THREAD__)
#define VFORK_IS_FORK
#elif defined(__has_feature)
#if __has_feature(thread_sanitizer)
#define VFORK_IS_FORK
#endif
#endif
