#pragma once

#include <string>

#include <boost/function.hpp>

#include <marubackup-util/export.h>

namespace MARU {
namespace Backup {

/**
 * Replaces the variables of `text`, each a name between "{{" and "}}".
 *
 * For each one `mapper` is called with the name, exactly as it stands between
 * the braces, and an empty text to put the value into. If it answers true the
 * value stands for the variable; it is not looked at again for variables of its
 * own. If it answers false the variable stays as it was written, braces
 * included: a value that is missing must never turn a path into its parent.
 *
 * A name reaches from the last "{{" before a "}}" up to it. All other braces
 * are plain text.
 */
MARUBACKUP_UTIL_API std::string replaceMustache(const std::string& text,
                                                boost::function<bool(const std::string&, std::string&)> mapper);

} // namespace Backup
} // namespace MARU
