#pragma once

#include <cerrno>
#include <stdexcept>
#include <string>
#include <system_error>

/** Why there can be no sandbox here, in words for the person who asked for one. */
class SetupError : public std::runtime_error {
public:
    using std::runtime_error::runtime_error;
};

/** Throws that `what` cannot be done, with the words for `error` and, if it is one of rights, the remedy. */
[[noreturn]] inline void fail(const std::string& what, int error) {
    const bool refused = error == EPERM || error == EACCES || error == ENOSPC; // the last: too many namespaces
    throw SetupError("cannot " + what + ": " + std::generic_category().message(error) +
                     (refused ? "; run it as root (in a container: with --privileged)" : ""));
}

/** Passes on `result`, unless it is negative: then errno says why `what` failed. */
template <typename Number>
Number check(Number result, const char* what, const std::string& object = "") {
    if (result < 0) {
        const int error = errno;
        fail(what + object, error);
    }
    return result;
}
