#pragma once

#include <string>

namespace MARU {
namespace Backup {

/** Where a session's directory stands: as `name` on the area `area`. */
struct SessionPlace {
    std::string area;
    std::string name;

    std::string path() const {
        return area + "/" + name;
    }
};

/** What a look at a session's record has found. */
enum class RecordState {
    FOUND,
    MISSING,
    UNUSABLE, ///< it is there and must not be relied on, or cannot be read
};

/** Whether an id is of the form that all ids have. */
bool isSessionId(const std::string& id);

/** The place of the session `id` on `area`. */
SessionPlace sessionPlace(const std::string& id, const std::string& area);

// The records. `id` is a session's id by its form.

/** Writes the record of a new session; all of it is there or nothing. */
bool writeRecord(const std::string& id, const SessionPlace& place);
/** Reads a record; `place` is written if it is found. */
RecordState readRecord(const std::string& id, SessionPlace& place);
/** True if the record is gone. */
bool removeRecord(const std::string& id);

} // namespace Backup
} // namespace MARU
