#include <cerrno>
#include <optional>
#include <string>
#include <system_error>

#include <marubackup/maru_archive_version.h>

#include "daemon.h"
#include "output.h"
#include "verbs.h"
#include "watchdog.h"
#include "words.h"

namespace {

/** One of the library's functions. */
using Function = int (*)(const char* path, unsigned* version);

/** What a call of it came to; `error` is errno. */
struct Answer {
    int result = 0;
    unsigned version = 0;
    int error = 0;
};

/** Why it failed, and what to do about that. */
std::string remedy(int error) {
    switch (error) {
    case ENOENT:
    case ENOTDIR:
    case ELOOP:
        return ": see that the path is right";
    case EACCES:
    case EPERM:
        return ": ask as root, or as somebody who may read it";
    default:
        return "";
    }
}

std::string wordsFor(int error) {
    return std::generic_category().message(error) + remedy(error);
}

/** Calls `function`, which may block, for as long as the user wants to wait. */
Answer call(Function function, const std::string& path, const Globals& globals) {
    const LastWords late = {std::string(),
                            sayLine(printable(path) + ": no answer within " + inSeconds(globals.timeout) +
                                    ": see that it is a folder or a regular file, on a file system that is there; or "
                                    "give it longer with --timeout"),
                            EXIT_TIMED_OUT};
    const Watchdog watchdog(globals.timeout, late, std::nullopt);
    Answer answer;
    errno = 0;
    answer.result = function(path.c_str(), &answer.version);
    answer.error = errno;
    return answer;
}

int putVersion(const std::string& path, unsigned version, const Globals& globals) {
    Json::Value json(Json::objectValue);
    json["path"] = path;
    json["version"] = version;
    putData((globals.json ? toLine(json) : std::to_string(version)) + "\n");
    return EXIT_DONE;
}

int sayFailure(const std::string& path, const std::string& what, const std::string& why) {
    say(printable(path) + ": " + what + ": " + why);
    return EXIT_OTHER;
}

std::string whyNoFileSystemVersion(int error) {
    if (error == ENOTTY) {
        return "its file system keeps none; name a path on a volume that does";
    }
    return error != 0 ? wordsFor(error) : "its file system answers something that is none";
}

} // namespace

int run(const ArchiveVersionGetVerb& verb, const Globals& globals) {
    const Answer answer = call(MARUBackupArchVerGet, verb.path, globals);
    if (answer.result == 0) {
        return putVersion(verb.path, answer.version, globals);
    }
    // What is kept with the file was read, and is too long or not a number.
    const bool isNone = answer.error == 0 || answer.error == ERANGE;
    return sayFailure(verb.path, "cannot read its archive version",
                      isNone ? "what is kept as one is no number of 32 bits: set it anew, or remove it"
                             : wordsFor(answer.error));
}

int run(const ArchiveVersionFsGetVerb& verb, const Globals& globals) {
    const Answer answer = call(MARUBackupFSArchVerGet, verb.path, globals);
    if (answer.result == 0) {
        return putVersion(verb.path, answer.version, globals);
    }
    return sayFailure(verb.path, "cannot read the archive version of its file system",
                      whyNoFileSystemVersion(answer.error));
}

int run(const ArchiveVersionFsIncreaseVerb& verb, const Globals& globals) {
    const Answer answer = call(MARUBackupFSArchVerIncrease, verb.path, globals);
    if (answer.result >= 0) {
        return putVersion(verb.path, answer.version, globals);
    }
    return sayFailure(verb.path, "cannot increase the archive version of its file system and read it",
                      whyNoFileSystemVersion(answer.error));
}
