#include "output.h"

#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "words.h"

namespace {

/** Whether all of it was written; if not, errno says why. */
bool writeAll(int descriptor, const std::string& text) {
    for (std::size_t written = 0; written < text.size();) {
        const ssize_t result = write(descriptor, text.data() + written, text.size() - written);
        if (result >= 0) {
            written += static_cast<std::size_t>(result);
        } else if (errno != EINTR) {
            return false;
        }
    }
    return true;
}

} // namespace

void putData(const std::string& lines) {
    if (!writeAll(STDOUT_FILENO, lines) && errno != EPIPE) {
        throw OutputError(std::string("cannot write to standard output: ") + std::strerror(errno));
    }
}

std::string sayLine(const std::string& text) {
    return "marubackupctl: " + text + "\n";
}

void say(const std::string& text) {
    writeAll(STDERR_FILENO, sayLine(text));
}

void sayVerdict(const std::string& subject, const Verdict& verdict) {
    say(subject + ": " + verdict.reason + " (code " + std::to_string(verdict.code) + ")");
}

std::string failureData(const Verdict& verdict, const Globals& globals) {
    return globals.json ? toLine(toJson(verdict)) + "\n" : std::string();
}

int reportFailure(int code, const std::string& subject, const Globals& globals) {
    const Verdict verdict = verdictOn(code);
    sayVerdict(subject, verdict);
    putData(failureData(verdict, globals));
    return verdict.status;
}
