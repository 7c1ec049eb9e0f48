#pragma once

#include <list>
#include <string>

#include <marubackup-util/export.h>

namespace MARU {
namespace Backup {

class OptionMapPrivate;

/**
 * One section of a configuration file.
 *
 * A file is text, one thing a line: a `[section]`, a `key = value`, a comment
 * that starts with `#` or `;`, or nothing. Blanks around sections, keys and
 * values do not count. A value is the rest of its line, read literally: `#`,
 * `;`, `=` and quotes inside it belong to it. Of a key given twice the last
 * one wins; a section may be given in several pieces.
 *
 * Used by one thread at a time. Does not throw on any file.
 */
class MARUBACKUP_UTIL_API OptionMap {
public:
    OptionMap();
    ~OptionMap();
    OptionMap(const OptionMap&) = delete;
    OptionMap& operator=(const OptionMap&) = delete;

    /**
     * Reads `section` of the file `path`, in place of what was there. False,
     * with nothing loaded, if the file cannot be read, is no regular file or
     * larger than 16 MiB, has no such section, or has a line anywhere that is
     * none of the above. The last argument is reserved; pass -1.
     */
    bool optSectionLoad(const std::string& path, const std::string& section, int reserved);
    /** Forgets everything. */
    void optClear();

    // Reading. False, with `value` untouched, if there is no such key.

    /** The value as it stands. The last argument is reserved; pass false. */
    bool optGet(const std::string& key, std::string& value, bool reserved) const;
    /**
     * The value's words, as a shell would split them: blanks separate; single
     * quotes, double quotes and backslash quote; nothing is expanded. Inside
     * double quotes a backslash quotes only `"` and `\`; inside single quotes
     * nothing does. Also false if a quote is not closed or a backslash is last.
     */
    bool optGet(const std::string& key, std::list<std::string>& value) const;
    /** The value as a decimal number; also false if it is none or too large. */
    bool optGet(const std::string& key, int& value) const;

private:
    OptionMapPrivate* d;
};

} // namespace Backup
} // namespace MARU
