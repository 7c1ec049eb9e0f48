#pragma once

#include <optional>
#include <variant>

#include "verbs.h"

struct Options {
    Globals globals;
    std::variant<AddVerb, ListVerb, ShowVerb, RemoveVerb, WaitVerb, BackendsVerb, StatusVerb, SessionCreateVerb,
                 SessionPathVerb, SessionDestroyVerb, SessionExpireVerb, ArchiveVersionGetVerb, ArchiveVersionFsGetVerb,
                 ArchiveVersionFsIncreaseVerb>
        verb;
};

/**
 * Reads the command line into `options`. If the tool ends with that (--help,
 * --version, a mistake), the user was told, and the result is the exit status.
 */
std::optional<int> readOptions(int argc, char** argv, Options& options);
