#pragma once

#include <string>

#include <taskmanager/export.h>

namespace HOS {

/**
 * The writing side: what makes a task visible, in the format that
 * `docs/platform.md` describes. It belongs to this implementation of the library
 * and is for tools and tests; on the appliance the task manager itself writes.
 *
 * A reader sees each change as a whole or not at all. Several threads and
 * processes may write at once; of two changes to one task the later one stands.
 * Each function is false, with errno set and nothing changed, if it fails: names
 * that name no task (EINVAL), or a folder that we may not write to.
 */
class TASKMANAGER_API TaskFile {
public:
    /** Makes a task, or replaces the one of that id. `pid` is a process id, or -1 for none. */
    static bool create(const std::string& owner, const std::string& id, int pid);
    /** Marks a task as finished; false (ENOENT) if there is none. */
    static bool finish(const std::string& owner, const std::string& id);
    /** Removes a task, or what stands in its place; false (ENOENT) if there is none. */
    static bool remove(const std::string& owner, const std::string& id);
};

} // namespace HOS
